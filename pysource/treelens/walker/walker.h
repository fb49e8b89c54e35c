// The symbol walker: CNodeWalker and the generic CDispatchWalker.
#ifndef TREELENS_WALKER_WALKER_H
#define TREELENS_WALKER_WALKER_H

#include "fieldpickle.h"
#include "pyref.h"

#include <vector>

namespace treelens {
namespace walker {

/// CNodeWalker; final. Fields in declaration order. NULL object fields read as None.
struct NodeWalkerObject {
  PyObject_HEAD
  PyObject *Logical;       ///< the record being walked; NULL while idle (the busy mark)
  bool LoadNameContext;    ///< names met are read (true) or assigned (false)
  bool StoreWithinSubExpr; ///< in store context: the binding is local to an expression
  PyObject *LoadedNames;   ///< dict: name read -> ""
  PyObject *StoredNames;   ///< dict: name bound in a sub-expression -> ";"-joined infos
  int VisitCount;
  int RecurseCount;
  int MaxVisits;
  int MaxRecurseCount;
  PyObject *ToText; ///< CNodeToTextConverter with every option on
  bool IncludeExprText;
  // The names of LoadedNames and StoredNames in the order the walk first met
  // them (lists, NULL until the first name), so that what a line records does
  // not depend on string hashing.
  PyObject *LoadedOrder;
  PyObject *StoredOrder;
};

/// CDispatchWalker and its subclasses (CTypeHintWalker extends this layout).
struct DispatchWalkerObject {
  PyObject_HEAD
  PyObject *Logical;      ///< NULL while idle
  PyObject *DispatchDict; ///< dict (node class -> handler or False), or NULL for None
  int VisitCount;
  int RecurseCount;
  int MaxVisits;
  int MaxRecurseCount;
  PyObject *NodeStack; ///< list of the nodes whose visit is in progress
};

TL_HIDDEN PyTypeObject &nodeWalkerType();
TL_HIDDEN PyTypeObject &dispatchWalkerType();

/// CNodeWalker.Walk(node, logical) as the analyzer calls it: Node is the
/// statement tree or Py_None. Throws PyErrSet.
TL_HIDDEN void walk(PyObject *Walker, PyObject *Node, PyObject *Logical);

/// CDispatchWalker.Walk(node, logical), honouring a Python-level override of
/// Walk in W's class. Throws PyErrSet.
TL_HIDDEN void dispatchWalk(PyObject *W, PyObject *Node, PyObject *Logical);
/// The base class's own Walk (what an override reaches through the base).
TL_HIDDEN void dispatchWalkBase(DispatchWalkerObject *W, PyObject *Node, PyObject *Logical);
/// CDispatchWalker._VisitNode(node), honouring a Python-level override. Throws PyErrSet.
TL_HIDDEN void dispatchVisitNode(PyObject *W, PyObject *Node);

/// Tp slots a subclass layout (CTypeHintWalker) chains to.
TL_HIDDEN int dispatchWalkerTraverse(PyObject *Self, visitproc Visit, void *Arg);
TL_HIDDEN int dispatchWalkerClear(PyObject *Self);
/// Sets the CDispatchWalker fields as the constructor does. Throws PyErrSet.
TL_HIDDEN void dispatchWalkerSetUp(DispatchWalkerObject *W, PyObject *DispatchDict);
/// The pickled fields of CDispatchWalker, which classes of its layout extend.
TL_HIDDEN std::vector<tl::FieldSpec> dispatchWalkerFields();

/// Writes "RuntimeError raised in CNodeWalker.Walk: <repr>" for the pending
/// RuntimeError to the host's sys.stdout and clears it.
TL_HIDDEN void reportWalkRuntimeError();

/// Readies CNodeWalker and CDispatchWalker; -1 on failure.
TL_HIDDEN int initWalkerTypes(PyObject *Module);

} // namespace walker
} // namespace treelens

#endif
