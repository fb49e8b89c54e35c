// A small slot-table API for defining Python 2.7 types from C++.
#ifndef TREELENS_COMMON_TYPEDESC_H
#define TREELENS_COMMON_TYPEDESC_H

#include "pyref.h"

namespace tl {

/// Named fields of a static type; readyType copies them and readies it.
struct TypeDesc {
  const char *Name = nullptr;
  const char *Doc = nullptr;
  Py_ssize_t Size = 0;
  PyTypeObject *Base = nullptr;
  long Flags = Py_TPFLAGS_DEFAULT | Py_TPFLAGS_BASETYPE;
  PyMethodDef *Methods = nullptr;
  PyGetSetDef *GetSets = nullptr;
  PyMemberDef *Members = nullptr;
  destructor Dealloc = nullptr;
  traverseproc Traverse = nullptr;
  inquiry Clear = nullptr;
  initproc Init = nullptr;
  newfunc New = nullptr;
  reprfunc Repr = nullptr;
  reprfunc Str = nullptr;
  getiterfunc Iter = nullptr;
  iternextfunc IterNext = nullptr;
  richcmpfunc RichCompare = nullptr;
  Py_ssize_t WeakListOffset = 0;
};

/// tp_dealloc of a GC type whose tp_clear releases every field it owns.
template <inquiry Clear> void gcDealloc(PyObject *Self) {
  PyObject_GC_UnTrack(Self);
  Clear(Self);
  Py_TYPE(Self)->tp_free(Self);
}

/// Fills T from D and calls PyType_Ready; -1 with an exception on failure.
TL_HIDDEN int readyType(PyTypeObject &T, const TypeDesc &D);

/// Adds a readied type to a module under its short name; -1 on failure.
TL_HIDDEN int addType(PyObject *Module, const char *Name, PyTypeObject &T);

} // namespace tl

#endif
