// The three small symbol-info functions compiled into the module.
#include "pysource/treelens/host/host.h"

namespace treelens {
namespace host {

namespace {

// An info string that carries a kind begins with ":" and the kind byte;
// every other info string is a plain equivalence.
PyObject *sym_GetInfoBytesKind(PyObject *, PyObject *IBytes) {
  if (!PyString_Check(IBytes)) {
    PyErr_Format(PyExc_TypeError, "Expected %.16s, got %.200s", "bytes", Py_TYPE(IBytes)->tp_name);
    return nullptr;
  }
  const char *S = PyString_AS_STRING(IBytes);
  char Kind = PyString_GET_SIZE(IBytes) < 2 || S[0] != ':' ? Host.PlainEquivKind : S[1];
  return PyString_FromStringAndSize(&Kind, 1);
}

PyObject *sym_IsDefKind(PyObject *, PyObject *Kind) {
  return tl::guard<PyObject *>(nullptr, [&] {
    char K;
    if (PyString_Check(Kind) && PyString_GET_SIZE(Kind) == 1) {
      K = PyString_AS_STRING(Kind)[0];
    } else {
      long V = PyInt_AsLong(Kind);
      if (V == -1 && PyErr_Occurred())
        throw tl::PyErrSet();
      if (V < 0 || V > 255)
        return PyBool_FromLong(0);
      K = static_cast<char>(V);
    }
    return PyBool_FromLong(K == Host.FunctionKind || K == Host.MethodKind || K == Host.UnboundMethodKind);
  });
}

PyObject *sym_IsTopLevelModuleScope(PyObject *, PyObject *Scope) {
  if (!PyString_Check(Scope)) {
    PyErr_Format(PyExc_TypeError, "Expected %.16s, got %.200s", "bytes", Py_TYPE(Scope)->tp_name);
    return nullptr;
  }
  return PyBool_FromLong(PyString_GET_SIZE(Scope) == 0);
}

} // namespace

PyMethodDef SymbolInfoFunctions[] = {
    {"IsDefKind", sym_IsDefKind, METH_O,
     "IsDefKind(kind) -> bool: whether kind is the function, method or unbound method kind"},
    {"GetInfoBytesKind", sym_GetInfoBytesKind, METH_O,
     "GetInfoBytesKind(ibytes) -> bytes: the kind byte of an info string"},
    {"IsTopLevelModuleScope", sym_IsTopLevelModuleScope, METH_O,
     "IsTopLevelModuleScope(scope) -> bool: whether the scope name is the module's (empty)"},
    {nullptr, nullptr, 0, nullptr}};

} // namespace host
} // namespace treelens
