// Helpers shared by the accessor files: fixed-position child reads, token text tests, override
// dispatch, unraisable reports and Python argument conversion.
#ifndef TREELENS_NODES_NODEHELP_H
#define TREELENS_NODES_NODEHELP_H

#include "pysource/treelens/nodes/node.h"

#include <cstring>

namespace treelens {
namespace nodehelp {

inline PyObject *obj(NodeObject *N) { return reinterpret_cast<PyObject *>(N); }
inline NodeObject *node(PyObject *O) { return reinterpret_cast<NodeObject *>(O); }

/// Raises the conversion TypeError for O not being an instance of T.
[[noreturn]] inline void raiseCannotConvert(PyObject *O, PyTypeObject &T) {
  tl::raiseFormat(PyExc_TypeError, "Cannot convert %.200s to %.200s", Py_TYPE(O)->tp_name, T.tp_name);
}

/// N's operations as the ops struct of the native class C; TypeError unless N is a C.
template <class Ops> const Ops *opsAs(NodeObject *N, NodeClass C) {
  if (!isNodeOf(obj(N), C))
    raiseCannotConvert(obj(N), nodeType(C));
  return static_cast<const Ops *>(opsOf(N));
}

/// c[K]: borrowed child K of N read with list indexing (negative K from the
/// end); IndexError past either end, TypeError for a leaf or a non-node child.
inline NodeObject *childAt(NodeObject *N, Py_ssize_t K) {
  if (!N->Children)
    tl::raise(PyExc_TypeError, "'NoneType' object has no attribute '__getitem__'");
  Py_ssize_t Count = PyList_GET_SIZE(N->Children);
  if (K < 0)
    K += Count;
  if (K < 0 || K >= Count)
    tl::raise(PyExc_IndexError, "list index out of range");
  PyObject *C = PyList_GET_ITEM(N->Children, K);
  if (!isNode(C))
    raiseCannotConvert(C, cnodeType());
  return node(C);
}

/// Index arithmetic on caller-given indexes, saturating instead of
/// overflowing: a saturated index is out of range either way.
inline Py_ssize_t twice(Py_ssize_t I) {
  return I > PY_SSIZE_T_MAX / 2 ? PY_SSIZE_T_MAX : I < PY_SSIZE_T_MIN / 2 ? PY_SSIZE_T_MIN : 2 * I;
}
inline Py_ssize_t plus(Py_ssize_t I, Py_ssize_t K) {
  return I > PY_SSIZE_T_MAX - K ? PY_SSIZE_T_MAX : I + K;
}

/// Number of entries of N's children list, 0 for a leaf.
inline Py_ssize_t rawCount(NodeObject *N) { return N->Children ? PyList_GET_SIZE(N->Children) : 0; }

/// True when Text is a byte string equal to the NUL-terminated Lit.
inline bool textIs(PyObject *Text, const char *Lit) {
  if (!Text || !PyString_Check(Text))
    return false;
  std::size_t Len = std::strlen(Lit);
  return static_cast<std::size_t>(PyString_GET_SIZE(Text)) == Len &&
         std::memcmp(PyString_AS_STRING(Text), Lit, Len) == 0;
}

/// True when N's own token text equals Lit.
inline bool leafIs(NodeObject *N, const char *Lit) { return textIs(N->Text, Lit); }

/// text(K) == Lit, reading the child text through GetChildText.
inline bool childTextIs(NodeObject *N, Py_ssize_t K, const char *Lit) {
  tl::Ref T = nodeGetChildText(N, K);
  return textIs(T.get(), Lit);
}

/// A new reference to a borrowed node (Py_None for nullptr).
inline tl::Ref ref(NodeObject *N) { return tl::Ref::borrow(N ? obj(N) : Py_None); }
inline tl::Ref none() { return tl::Ref::borrow(Py_None); }

/// Prints the pending exception as unraisable from the named operation.
inline void reportUnraisable(const char *Where) {
  PyObject *Name = PyString_FromString(Where);
  PyErr_WriteUnraisable(Name ? Name : Py_None);
  Py_XDECREF(Name);
}

/// Runs Body; any failure is reported as unraisable from Where and gives Fallback.
template <class R, class F> R neverRaises(const char *Where, R Fallback, F &&Body) noexcept {
  bool Failed = false;
  R Result = tl::guard<R>(Fallback, [&] {
    try {
      return Body();
    } catch (...) {
      Failed = true;
      throw;
    }
  });
  if (Failed) {
    if (PyErr_Occurred())
      reportUnraisable(Where);
    return Fallback;
  }
  return Result;
}

/// Truth value of a method's result.
inline bool truth(const tl::Ref &R) { return tl::requireStatus(PyObject_IsTrue(R.get())) != 0; }

/// Native integer of a method's result.
inline Py_ssize_t sizeOf(const tl::Ref &R) {
  Py_ssize_t V = PyInt_AsSsize_t(R.get());
  if (V == -1 && PyErr_Occurred())
    throw tl::PyErrSet();
  return V;
}

/// Integer argument of a Python call; TypeError "an integer is required" otherwise.
inline Py_ssize_t indexArg(PyObject *Arg) {
  if (!PyInt_Check(Arg) && !PyLong_Check(Arg) && !PyIndex_Check(Arg))
    tl::raise(PyExc_TypeError, "an integer is required");
  Py_ssize_t I = PyNumber_AsSsize_t(Arg, PyExc_OverflowError);
  if (I == -1 && PyErr_Occurred())
    throw tl::PyErrSet();
  return I;
}

/// The argument-check TypeError for a Python argument of the wrong type.
[[noreturn]] inline void raiseArgType(const char *ArgName, const char *Expected, PyObject *Got) {
  tl::raiseFormat(PyExc_TypeError, "Argument '%.200s' has incorrect type (expected %.200s, got %.200s)",
                  ArgName, Expected, Py_TYPE(Got)->tp_name);
}

/// Python booleans and integers as new references.
inline PyObject *pyBool(bool B) { return PyBool_FromLong(B); }

} // namespace nodehelp
} // namespace treelens

#endif
