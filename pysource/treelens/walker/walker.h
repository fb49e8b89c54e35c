// The symbol walker: CNodeWalker and the generic CDispatchWalker.
#ifndef TREELENS_WALKER_WALKER_H
#define TREELENS_WALKER_WALKER_H

#include "pyref.h"

namespace treelens {
namespace walker {

TL_HIDDEN PyTypeObject &nodeWalkerType();
TL_HIDDEN PyTypeObject &dispatchWalkerType();

/// CNodeWalker.Walk(node, logical) as the analyzer calls it: Node is the
/// statement tree or Py_None. Throws PyErrSet.
TL_HIDDEN void walk(PyObject *Walker, PyObject *Node, PyObject *Logical);

/// Readies CNodeWalker and CDispatchWalker; -1 on failure.
TL_HIDDEN int initWalkerTypes(PyObject *Module);

} // namespace walker
} // namespace treelens

#endif
