// Expression node classes: their native operations (virtual slots) and the native callers that honour
// Python-level overrides.
#ifndef TREELENS_NODES_EXPR_H
#define TREELENS_NODES_EXPR_H

#include "pysource/treelens/nodes/node.h"

namespace treelens {

// Conventions of the slots declared here (the own slots of the classes; the
// overrides of slots 6 and 7 keep ExpressionOps' conventions):
// - Node and text results are new references (Py_None when absent); a
//   failure throws tl::PyErrSet with the Python error set.
// - Operations documented as "never raises" catch their own errors, report
//   them as unraisable under the operation's qualified name and return
//   false or 0.
// Native code should call the free functions below rather than the slots:
// they check the node's class (TypeError "Cannot convert ..." otherwise) and
// call a Python-level override when the node's class defines one.

/// CAtom: slots 6, 7 (overrides), 8 to 11.
struct AtomOps : ExpressionOps {
  PyObject *getSubExpr(NodeObject *N, Py_ssize_t I) const override;
  Py_ssize_t getSubExprCount(NodeObject *N) const override; ///< never raises
  /// Slot 8: "[", "{", "(" (the child's own text object) or Py_None;
  /// ValueError "Atom node with no children".
  virtual tl::Ref getInitialBracket(NodeObject *N) const;
  virtual bool isLiteral(NodeObject *N) const;               ///< slot 9; never raises
  virtual bool isComprehension(NodeObject *N) const;         ///< slot 10; throws
  virtual bool isTwoPlusStringLiterals(NodeObject *N) const; ///< slot 11; never raises
};

/// CStarExpression: slot 8.
struct StarExpressionOps : ExpressionOps {
  virtual tl::Ref getStarredExpression(NodeObject *N) const; ///< c[1]
};

/// CLambdaExpr: slots 8, 9 (native-only).
struct LambdaOps : ExpressionOps {
  virtual tl::Ref getArgumentsNode(NodeObject *N) const; ///< c[1] or Py_None
  virtual tl::Ref getBodyExpr(NodeObject *N) const;      ///< c[-1]
};

/// CYieldExpr: slots 8, 9.
struct YieldExprOps : ExpressionOps {
  virtual tl::Ref getValue(NodeObject *N) const;
  virtual bool isYieldFrom(NodeObject *N) const; ///< never raises
};

/// CTestListStarExpr: slots 6, 7 (overrides), 8, 9.
struct TestListStarExprOps : ExpressionOps {
  /// ValueError "Not enough expressions in list" or "Elenment ..." as documented.
  PyObject *getSubExpr(NodeObject *N, Py_ssize_t I) const override;
  Py_ssize_t getSubExprCount(NodeObject *N) const override; ///< never raises
  virtual bool isTuple(NodeObject *N) const;                ///< slot 8; never raises
  virtual bool isGenExpr(NodeObject *N) const;              ///< slot 9; never raises
};

/// CAtomExpr: slots 8 to 10.
struct AtomExprOps : ExpressionOps {
  virtual tl::Ref getPrefix(NodeObject *N) const; ///< the "await" keyword node or Py_None
  virtual tl::Ref getAtom(NodeObject *N) const;
  virtual tl::Ref getTrailers(NodeObject *N) const; ///< new list
};

/// CPower: slots 8 to 10.
struct PowerOps : ExpressionOps {
  virtual tl::Ref getAtom(NodeObject *N) const;
  virtual tl::Ref getTrailers(NodeObject *N) const; ///< new list
  virtual tl::Ref getExponentNode(NodeObject *N) const;
};

/// CNumberLiteral: slot 8.
struct NumberLiteralOps : ExpressionOps {
  virtual bool isFloat(NodeObject *N) const; ///< never raises
};

/// CStringLiteral: slots 8, 9.
struct StringLiteralOps : ExpressionOps {
  virtual bool isUnicode(NodeObject *N) const;            ///< never raises
  virtual tl::Ref getStringContents(NodeObject *N) const; ///< new bytes
};

/// CFactorExpr: slot 8.
struct FactorOps : ExpressionOps {
  virtual tl::Ref getUnaryOperator(NodeObject *N) const; ///< "+", "-", "~" or Py_None
};

/// CYieldArg (a CNode): slots 6, 7.
struct YieldArgOps : NodeOps {
  virtual tl::Ref getValue(NodeObject *N) const;
  virtual bool isYieldFrom(NodeObject *N) const; ///< never raises
};

/// CCompForNode (a CNode): slots 6 to 9.
struct CompForOps : NodeOps {
  virtual bool isAsync(NodeObject *N) const; ///< never raises
  virtual tl::Ref getTargetNode(NodeObject *N) const;
  virtual tl::Ref getInNode(NodeObject *N) const;
  virtual tl::Ref getCompIterNode(NodeObject *N) const; ///< Py_None unless len is 5 (+1 if async)
};

/// CListmakerNode (a CNode): slots 6, 7 (count first).
struct ListmakerOps : NodeOps {
  virtual Py_ssize_t getSubExprCount(NodeObject *N) const; ///< never raises
  virtual tl::Ref getSubExpr(NodeObject *N, Py_ssize_t I) const;
};

/// CTrailer: its operations are Python-level only; these are their native bodies.
struct TrailerOps : NodeOps {
  virtual tl::Ref getDotName(NodeObject *N) const;      ///< attribute name text or Py_None
  virtual tl::Ref getNestedNode(NodeObject *N) const;   ///< c[1] of "(" x ")" / "[" x "]", or Py_None
  virtual tl::Ref getInitialToken(NodeObject *N) const; ///< ValueError "Trailer node with no children"
};

// ---- Native callers. Node results are new references (None when absent);
// every function throws tl::PyErrSet unless marked "never raises". ----

// CAtom (GetSubExpr / GetSubExprCount: exprGetSubExpr / exprGetSubExprCount of node.h)
TL_HIDDEN tl::Ref atomGetInitialBracket(NodeObject *N);
TL_HIDDEN bool atomIsLiteral(NodeObject *N); ///< never raises
TL_HIDDEN bool atomIsComprehension(NodeObject *N);
TL_HIDDEN bool atomIsTwoPlusStringLiterals(NodeObject *N); ///< never raises
// CStarExpression
TL_HIDDEN tl::Ref starGetStarredExpression(NodeObject *N);
// CLambdaExpr
TL_HIDDEN tl::Ref lambdaGetArgumentsNode(NodeObject *N);
TL_HIDDEN tl::Ref lambdaGetBodyExpr(NodeObject *N);
// CYieldExpr
TL_HIDDEN tl::Ref yieldExprGetValue(NodeObject *N);
TL_HIDDEN bool yieldExprIsYieldFrom(NodeObject *N); ///< never raises
// CYieldArg
TL_HIDDEN tl::Ref yieldArgGetValue(NodeObject *N);
TL_HIDDEN bool yieldArgIsYieldFrom(NodeObject *N); ///< never raises
// CTestListStarExpr
TL_HIDDEN bool testListIsTuple(NodeObject *N);   ///< never raises
TL_HIDDEN bool testListIsGenExpr(NodeObject *N); ///< never raises
// CAtomExpr
TL_HIDDEN tl::Ref atomExprGetPrefix(NodeObject *N);
TL_HIDDEN tl::Ref atomExprGetAtom(NodeObject *N);
TL_HIDDEN tl::Ref atomExprGetTrailers(NodeObject *N); ///< a list (new unless overridden)
// CPower
TL_HIDDEN tl::Ref powerGetAtom(NodeObject *N);
TL_HIDDEN tl::Ref powerGetTrailers(NodeObject *N); ///< a list
TL_HIDDEN tl::Ref powerGetExponentNode(NodeObject *N);
// CNumberLiteral
TL_HIDDEN bool numberIsFloat(NodeObject *N); ///< never raises
// CStringLiteral
TL_HIDDEN bool stringIsUnicode(NodeObject *N); ///< never raises
TL_HIDDEN tl::Ref stringGetStringContents(NodeObject *N);
// CFactorExpr
TL_HIDDEN tl::Ref factorGetUnaryOperator(NodeObject *N);
// CCompForNode
TL_HIDDEN bool compForIsAsync(NodeObject *N); ///< never raises
TL_HIDDEN tl::Ref compForGetTargetNode(NodeObject *N);
TL_HIDDEN tl::Ref compForGetInNode(NodeObject *N);
TL_HIDDEN tl::Ref compForGetCompIterNode(NodeObject *N);
// CListmakerNode
TL_HIDDEN Py_ssize_t listmakerGetSubExprCount(NodeObject *N); ///< never raises
TL_HIDDEN tl::Ref listmakerGetSubExpr(NodeObject *N, Py_ssize_t I);
// CTrailer
TL_HIDDEN tl::Ref trailerGetDotName(NodeObject *N);
TL_HIDDEN tl::Ref trailerGetNestedNode(NodeObject *N);
TL_HIDDEN tl::Ref trailerGetInitialToken(NodeObject *N);

/// The ops and Python methods of the expression classes, for the class table.
TL_HIDDEN const NodeOps *exprClassOps(NodeClass C);
TL_HIDDEN PyMethodDef *exprClassMethods(NodeClass C);

} // namespace treelens

#endif
