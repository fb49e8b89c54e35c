// Calling Python-level overrides of methods that native code calls on native objects.
//
// A native type implements an operation in C++ and also publishes it as a
// Python method. Native callers take the C++ path unless the object's class is
// a Python subclass whose own class body (or a Python base) redefines the
// method; only then is the Python method called. Instances of native types
// cost one flag test; instances of Python subclasses two cached type lookups.
#ifndef TREELENS_COMMON_OVERRIDE_H
#define TREELENS_COMMON_OVERRIDE_H

#include "pyref.h"

namespace tl {

/// The nearest class in T's base chain that is defined natively (T itself
/// unless T is a Python class).
inline PyTypeObject *nativeBase(PyTypeObject *T) {
  while (T && (T->tp_flags & Py_TPFLAGS_HEAPTYPE))
    T = T->tp_base;
  return T;
}

/// Borrowed: the attribute that overrides the interned method Name for Self,
/// or nullptr when Self's class gets Name from its nearest native base (call
/// the C++ implementation then). Never raises.
inline PyObject *pythonOverride(PyObject *Self, PyObject *Name) {
  PyTypeObject *T = Py_TYPE(Self);
  if (!(T->tp_flags & Py_TPFLAGS_HEAPTYPE))
    return nullptr;
  PyObject *Found = _PyType_Lookup(T, Name);
  if (!Found || Found == _PyType_Lookup(nativeBase(T), Name))
    return nullptr;
  return Found;
}

/// Calls the method Name of Self through Python with the given arguments.
template <class... A> Ref callMethod(PyObject *Self, PyObject *Name, A... Args) {
  return require(PyObject_CallMethodObjArgs(Self, Name, static_cast<PyObject *>(Args)..., nullptr));
}

/// A METH_VARARGS | METH_KEYWORDS function as a method-table entry.
inline PyCFunction kwFunction(PyObject *(*Fn)(PyObject *, PyObject *, PyObject *)) {
  return reinterpret_cast<PyCFunction>(reinterpret_cast<void (*)()>(Fn));
}

/// Interns a method name once; the result lives as long as the process.
inline PyObject *internName(const char *Name) {
  PyObject *S = PyString_InternFromString(Name);
  if (!S)
    throw PyErrSet();
  return S;
}

} // namespace tl

#endif
