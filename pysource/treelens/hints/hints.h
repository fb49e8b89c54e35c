// Type-comment hints: the CTypeHintWalker.
#ifndef TREELENS_HINTS_HINTS_H
#define TREELENS_HINTS_HINTS_H

#include "pyref.h"

namespace treelens {
namespace hints {

TL_HIDDEN PyTypeObject &typeHintWalkerType();

/// CTypeHintWalker.Walk(node, logical) as the analyzer calls it: Node is the
/// statement tree or Py_None. Throws PyErrSet.
TL_HIDDEN void walk(PyObject *Walker, PyObject *Node, PyObject *Logical);

/// Readies CTypeHintWalker (after CDispatchWalker); -1 on failure.
TL_HIDDEN int initHintTypes(PyObject *Module);

} // namespace hints
} // namespace treelens

#endif
