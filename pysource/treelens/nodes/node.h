// The node model: the node and class-info layouts, the node class table and the base node operations.
#ifndef TREELENS_NODES_NODE_H
#define TREELENS_NODES_NODE_H

#include "override.h"
#include "typedesc.h"

namespace treelens {

struct NodeObject;

/// CNodeClassInfo: one grammar state. Invariant: the nodes on the free list
/// FirstFree -> NextFree -> ... are discarded nodes of this state, each held
/// by one reference from its predecessor (the head by this record).
struct ClassInfoObject {
  PyObject_HEAD
  PyObject *Cls;         ///< node class to instantiate; owned, NULL read as None
  int NodeType;          ///< token type (< 256) or grammar symbol number
  PyObject *Name;        ///< state name, bytes; owned, NULL read as None
  NodeObject *FirstFree; ///< head of the free list; owned, NULL read as None
  Py_ssize_t FreeCount;  ///< nodes the factory put on the free list and has not taken back (a bound, not a length)
};

/// CNode and every node class: all state a node has. NULL fields read as None.
struct NodeObject {
  PyObject_HEAD
  PyObject *Children;       ///< list of nodes; NULL for a leaf or a discarded node
  PyObject *Text;           ///< token text of a leaf (bytes), NULL for a nonterminal
  PyObject *Context;        ///< parse context: the token index (an int)
  ClassInfoObject *ClsInfo; ///< grammar state of the node
  NodeObject *NextFree;     ///< free-list link while discarded
  bool OnFreeList;          ///< set while the node is on a free list (not visible from Python)
};

/// Native implementations of the node operations, one instance per node class
/// that defines or overrides any; a class without its own uses its base's.
/// Subclass ops extend their base's ops struct the way the classes extend theirs.
struct NodeOps {
  virtual ~NodeOps() = default;
  // Slot 1. Never raises.
  virtual Py_ssize_t getChildCount(NodeObject *N) const;
  // Slot 2. Borrowed; nullptr with an exception set on error; Py_None when absent.
  virtual PyObject *getChildText(NodeObject *N, Py_ssize_t I) const;
  // Slot 3. Borrowed; nullptr with an exception set on error; Py_None when absent.
  virtual PyObject *getChild(NodeObject *N, Py_ssize_t I) const;
  // Slot 4. Borrowed; nullptr with an exception set.
  virtual PyObject *getStateName(NodeObject *N) const;
  // Slot 5. Text may be Py_None. Never raises.
  virtual bool doesChildTextMatch(NodeObject *N, PyObject *Text) const;
};

/// The CExpression slots 6 and 7.
struct ExpressionOps : NodeOps {
  /// Borrowed CExpression or Py_None; nullptr with an exception set.
  virtual PyObject *getSubExpr(NodeObject *N, Py_ssize_t I) const;
  /// -1 with an exception set.
  virtual Py_ssize_t getSubExprCount(NodeObject *N) const;
};

/// Every native node class, in the order of the class table.
enum class NodeClass : int {
  CNode,
  CStmt,
  CExpression,
  CAtom,
  CBinaryExpression,
  CStarExpression,
  CImportNamesStmt,
  CFromImportStmt,
  CSingleUsedArgumentNode,
  CFunctionParameterDef,
  CDefiningArglistNode,
  CUsedArglistNode,
  CParametersNode,
  CClassdefStmt,
  CFuncdefStmt,
  CSingleDecorator,
  CDottedName,
  CMultipleDecorators,
  CLambdaExpr,
  CGlobalStmt,
  CNonlocalStmt,
  CForStmt,
  CWithStmt,
  CWithItem,
  CPassStmt,
  CExceptClause,
  CExprStmt,
  CAnnotatedAssignNode,
  CBinaryOp,
  CTestExpr,
  CReturnStmt,
  CYieldExpr,
  CYieldArg,
  CTestListStarExpr,
  CNameLiteral,
  CKeywordLiteral,
  CCompForNode,
  CListmakerNode,
  CTrailer,
  CAtomExpr,
  CPower,
  CNumberLiteral,
  CStringLiteral,
  CFactorExpr,
  CNamedExpr,
  CCaseBlock,
  CPattern,
  CTypeParams,
  CTypeAliasStmt,
  Count
};

/// A native node class: its type object and its operations.
struct NodeTypeObject {
  PyTypeObject Type;
  const NodeOps *Ops;
};

/// The CNodeClassInfo type.
TL_HIDDEN PyTypeObject &classInfoType();

/// The type object of a native node class.
TL_HIDDEN PyTypeObject &nodeType(NodeClass C);

inline PyTypeObject &cnodeType() { return nodeType(NodeClass::CNode); }

/// The deallocator every native node class shares.
TL_HIDDEN void nodeDealloc(PyObject *Self);

/// True when O is a CNode (any subclass). Native node classes share their
/// deallocator, which answers without walking the class's bases.
inline bool isNode(PyObject *O) {
  return Py_TYPE(O)->tp_dealloc == nodeDealloc || PyObject_TypeCheck(O, &cnodeType());
}

/// True when O is an instance of the native class C (subclasses included).
inline bool isNodeOf(PyObject *O, NodeClass C) { return PyObject_TypeCheck(O, &nodeType(C)); }

/// The operations of N's nearest native class.
inline const NodeOps *opsOf(NodeObject *N) {
  return reinterpret_cast<NodeTypeObject *>(tl::nativeBase(Py_TYPE(N)))->Ops;
}

/// Raises the standard conversion TypeError unless O is a CNode; returns it.
TL_HIDDEN NodeObject *asNode(PyObject *O);

/// Interned names of the node methods native code calls.
struct NodeMethodNames {
  PyObject *GetChildCount, *GetChildText, *GetChild, *GetStateName, *DoesChildTextMatch,
      *GetSubExpr, *GetSubExprCount;
};
TL_HIDDEN extern NodeMethodNames NodeNames;

// Native callers of the node operations. Each honours a Python-level override
// in a subclass and otherwise calls the native class's implementation.

/// Slot 1; never raises (errors are reported as unraisable, result 0).
TL_HIDDEN Py_ssize_t nodeGetChildCount(NodeObject *N);
/// Slot 2; new reference (None when absent).
TL_HIDDEN tl::Ref nodeGetChildText(NodeObject *N, Py_ssize_t I);
/// Slot 3; new reference (None when absent).
TL_HIDDEN tl::Ref nodeGetChild(NodeObject *N, Py_ssize_t I);
/// Slot 4; new reference.
TL_HIDDEN tl::Ref nodeGetStateName(NodeObject *N);
/// Slot 5; never raises (errors are reported as unraisable, result false).
TL_HIDDEN bool nodeDoesChildTextMatch(NodeObject *N, PyObject *Text);
/// Slot 6 of a CExpression; new reference (None when absent).
TL_HIDDEN tl::Ref exprGetSubExpr(NodeObject *N, Py_ssize_t I);
/// Slot 7 of a CExpression.
TL_HIDDEN Py_ssize_t exprGetSubExprCount(NodeObject *N);

/// Creates the node classes and adds them to the module; -1 on failure.
TL_HIDDEN int initNodeTypes(PyObject *Module);

/// Allocates a node of the native class T (not a Python subclass) for the
/// class info Info (borrowed, may be NULL), as CNode(Info) would. New reference.
TL_HIDDEN NodeObject *allocNode(PyTypeObject *T, ClassInfoObject *Info);

} // namespace treelens

#endif
