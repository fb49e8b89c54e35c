// Statement node classes and the parts of statements: their native operations (virtual slots), the
// native callers that honour Python-level overrides, and the import-name helpers.
#ifndef TREELENS_NODES_STMT_H
#define TREELENS_NODES_STMT_H

#include "pysource/treelens/nodes/node.h"

namespace treelens {

// Slot conventions as in expr.h: node, text and list results are new
// references (Py_None when absent), failures throw tl::PyErrSet, and the
// operations marked "never raises" report their errors as unraisable.

/// CFuncdefStmt: slots 6 to 9 ("def" NAME parameters ["->" test] ":" suite).
struct FuncdefOps : NodeOps {
  virtual tl::Ref getName(NodeObject *N) const;       ///< c[1].fText (native-only)
  virtual tl::Ref getParameters(NodeObject *N) const; ///< c[2]
  virtual tl::Ref getReturnType(NodeObject *N) const; ///< c[4] after "->", else Py_None
  virtual tl::Ref getSuite(NodeObject *N) const;      ///< c[-1]
};

/// CClassdefStmt: slot 6.
struct ClassdefOps : NodeOps {
  virtual tl::Ref getBaseClassList(NodeObject *N) const; ///< new list of CArgInfo
};

/// CGlobalStmt and CNonlocalStmt: slot 6.
struct NameListStmtOps : NodeOps {
  virtual tl::Ref getUtf8NameList(NodeObject *N) const; ///< new list of the names' texts
};

/// CForStmt: slots 6 to 9 ("for" targets "in" iterable ":" suite ["else" ":" suite]).
struct ForStmtOps : NodeOps {
  virtual tl::Ref getTarget(NodeObject *N) const;       ///< c[1]
  virtual tl::Ref getInExpression(NodeObject *N) const; ///< c[3]
  virtual tl::Ref getBody(NodeObject *N) const;         ///< c[5]
  virtual tl::Ref getElseBody(NodeObject *N) const;     ///< c[8] when c[6] is "else", else Py_None
};

/// CWithStmt: slot 6 (native-only).
struct WithStmtOps : NodeOps {
  virtual tl::Ref getWithItems(NodeObject *N) const; ///< new list of the CWithItem children
};

/// CWithItem: slots 6, 7 (native-only).
struct WithItemOps : NodeOps {
  virtual tl::Ref getExpression(NodeObject *N) const; ///< c[0]
  virtual tl::Ref getTarget(NodeObject *N) const;     ///< c[2]
};

/// CExceptClause: slots 6, 7 (native-only).
struct ExceptClauseOps : NodeOps {
  virtual tl::Ref getExceptionType(NodeObject *N) const; ///< GetChild(1)
  virtual tl::Ref getTarget(NodeObject *N) const;        ///< the child after "as" or ","
};

/// CExprStmt: slots 6 to 9.
struct ExprStmtOps : NodeOps {
  virtual Py_ssize_t getEqualCount(NodeObject *N) const; ///< native-only; never raises
  virtual tl::Ref getAnnotatedAssignNode(NodeObject *N) const;
  virtual tl::Ref getInitialTestExpr(NodeObject *N) const;
  /// ValueError "Not enough ='s" when the position is past the end.
  virtual tl::Ref getPostEqualsTestExpr(NodeObject *N, Py_ssize_t EqualNum) const;
};

/// CAnnotatedAssignNode: slots 6, 7 (":" test ["=" test]).
struct AnnotatedAssignOps : NodeOps {
  virtual tl::Ref getTypeHintNode(NodeObject *N) const;       ///< c[1]
  virtual tl::Ref getPostEqualsTestExpr(NodeObject *N) const; ///< c[3] or Py_None
};

/// CReturnStmt: slot 6.
struct ReturnStmtOps : NodeOps {
  virtual tl::Ref getValue(NodeObject *N) const; ///< c[1] or Py_None
};

/// CSingleDecorator: slots 6, 7 (native-only).
struct DecoratorOps : NodeOps {
  virtual tl::Ref getDottedName(NodeObject *N) const; ///< c[1]
  virtual tl::Ref getUsedArgList(NodeObject *N) const; ///< new list of CArgInfo
};

// ---- Native callers: check the node's class (TypeError "Cannot convert ..."
// otherwise) and call a Python-level override of a Python-visible operation
// when the node's class defines one. ----

TL_HIDDEN tl::Ref funcdefGetName(NodeObject *N);
TL_HIDDEN tl::Ref funcdefGetParameters(NodeObject *N);
TL_HIDDEN tl::Ref funcdefGetReturnType(NodeObject *N);
TL_HIDDEN tl::Ref funcdefGetSuite(NodeObject *N);
TL_HIDDEN tl::Ref classdefGetBaseClassList(NodeObject *N);
/// CGlobalStmt or CNonlocalStmt.
TL_HIDDEN tl::Ref nameListStmtGetUtf8NameList(NodeObject *N);
TL_HIDDEN tl::Ref forStmtGetTarget(NodeObject *N);
TL_HIDDEN tl::Ref forStmtGetInExpression(NodeObject *N);
TL_HIDDEN tl::Ref forStmtGetBody(NodeObject *N);
TL_HIDDEN tl::Ref forStmtGetElseBody(NodeObject *N);
TL_HIDDEN tl::Ref withStmtGetWithItems(NodeObject *N);
TL_HIDDEN tl::Ref withItemGetExpression(NodeObject *N);
TL_HIDDEN tl::Ref withItemGetTarget(NodeObject *N);
TL_HIDDEN tl::Ref exceptClauseGetExceptionType(NodeObject *N);
TL_HIDDEN tl::Ref exceptClauseGetTarget(NodeObject *N);
TL_HIDDEN Py_ssize_t exprStmtGetEqualCount(NodeObject *N); ///< never raises
TL_HIDDEN tl::Ref exprStmtGetAnnotatedAssignNode(NodeObject *N);
TL_HIDDEN tl::Ref exprStmtGetInitialTestExpr(NodeObject *N);
TL_HIDDEN tl::Ref exprStmtGetPostEqualsTestExpr(NodeObject *N, Py_ssize_t EqualNum);
/// The augmented-assignment operator text of a CExprStmt, or None.
TL_HIDDEN tl::Ref exprStmtGetAugAssignOp(NodeObject *N);
TL_HIDDEN tl::Ref annAssignGetTypeHintNode(NodeObject *N);
TL_HIDDEN tl::Ref annAssignGetPostEqualsTestExpr(NodeObject *N);
TL_HIDDEN tl::Ref returnStmtGetValue(NodeObject *N);
TL_HIDDEN tl::Ref decoratorGetDottedName(NodeObject *N);
TL_HIDDEN tl::Ref decoratorGetUsedArgList(NodeObject *N);
/// CImportNamesStmt.GetAsNameList: list of CAsName.
TL_HIDDEN tl::Ref importNamesGetAsNameList(NodeObject *N);
/// CFromImportStmt operations.
TL_HIDDEN Py_ssize_t fromImportGetImportIndex(NodeObject *N);
TL_HIDDEN tl::Ref fromImportGetFromString(NodeObject *N);
TL_HIDDEN bool fromImportGetImportStar(NodeObject *N);
TL_HIDDEN tl::Ref fromImportGetAsNameList(NodeObject *N);

// ---- Import-name helpers (also module functions) ----

/// _GetMatchingChildToken: position of N's first child whose fText equals
/// Text (Py_None matches an interior child), -1 when none. Never raises.
TL_HIDDEN Py_ssize_t getMatchingChildToken(NodeObject *N, PyObject *Text);
/// _TextForImportName: the leaf texts under the nodes of NodeList (a list),
/// joined with nothing between them. New bytes.
TL_HIDDEN tl::Ref textForImportName(PyObject *NodeList);
/// _ProcessSingleModuleNameAs: a new CAsName for a (dotted) name with an optional alias.
TL_HIDDEN tl::Ref processSingleModuleNameAs(NodeObject *N);
/// _ProcessAsNamesList: a new list of CAsName.
TL_HIDDEN tl::Ref processAsNamesList(NodeObject *N);

/// The ops and Python methods of the statement classes, for the class table.
TL_HIDDEN const NodeOps *stmtClassOps(NodeClass C);
TL_HIDDEN PyMethodDef *stmtClassMethods(NodeClass C);

/// Module functions _GetMatchingChildToken, _TextForImportName,
/// _ProcessSingleModuleNameAs, _ProcessAsNamesList, and the test hook
/// _CallNativeNodeOp.
TL_HIDDEN extern PyMethodDef StmtFunctions[];

} // namespace treelens

#endif
