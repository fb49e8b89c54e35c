// Readies static types from a TypeDesc.
#include "typedesc.h"

namespace tl {

int readyType(PyTypeObject &T, const TypeDesc &D) {
  T.tp_name = D.Name;
  T.tp_doc = D.Doc;
  T.tp_basicsize = D.Size;
  T.tp_base = D.Base;
  T.tp_flags = D.Flags;
  if (D.Traverse)
    T.tp_flags |= Py_TPFLAGS_HAVE_GC;
  T.tp_methods = D.Methods;
  T.tp_getset = D.GetSets;
  T.tp_members = D.Members;
  T.tp_dealloc = D.Dealloc;
  T.tp_traverse = D.Traverse;
  T.tp_clear = D.Clear;
  T.tp_init = D.Init;
  T.tp_new = D.New;
  T.tp_repr = D.Repr;
  T.tp_str = D.Str;
  T.tp_iter = D.Iter;
  T.tp_iternext = D.IterNext;
  T.tp_richcompare = D.RichCompare;
  T.tp_weaklistoffset = D.WeakListOffset;
  if (D.Iter || D.IterNext)
    T.tp_flags |= Py_TPFLAGS_HAVE_ITER;
  if (D.RichCompare)
    T.tp_flags |= Py_TPFLAGS_HAVE_RICHCOMPARE;
  if (D.WeakListOffset)
    T.tp_flags |= Py_TPFLAGS_HAVE_WEAKREFS;
  return PyType_Ready(&T);
}

int addType(PyObject *Module, const char *Name, PyTypeObject &T) {
  Py_INCREF(&T);
  if (PyModule_AddObject(Module, Name, reinterpret_cast<PyObject *>(&T)) < 0) {
    Py_DECREF(&T);
    return -1;
  }
  return 0;
}

} // namespace tl
