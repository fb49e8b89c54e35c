// Inline operations on the host's logical-line records, scope names, sets, bit patterns and time.
#include "pysource/treelens/host/host.h"

#include <cstring>

namespace treelens {
namespace host {

using tl::Ref;

LogicalLineObject *requireLogical(PyObject *O) {
  if (!isLogical(O))
    tl::raise(PyExc_TypeError, "Argument must be a logical");
  return reinterpret_cast<LogicalLineObject *>(O);
}

LogicalLineObject *requireLogicalArg(PyObject *O, const char *ArgName) {
  if (!isLogical(O))
    tl::raiseFormat(PyExc_TypeError, "Argument '%.200s' has incorrect type (expected %.200s, got %.200s)",
                    ArgName, Host.LogicalLineType->tp_name, Py_TYPE(O)->tp_name);
  return reinterpret_cast<LogicalLineObject *>(O);
}

PyObject *logicalTokenText(LogicalLineObject *L, Py_ssize_t I) {
  if (I < 0 || I >= L->TokenCount)
    tl::raise(PyExc_IndexError, "Index not in range");
  PyObject *T = L->Texts[I];
  return T ? T : Py_None;
}

namespace {

/// A token text that starts with neither a backslash nor "#".
bool isKeptToken(PyObject *Text) {
  tl::expectType(PyString_Check(Text), "bytes", Text);
  if (PyString_GET_SIZE(Text) == 0)
    return true;
  char C = PyString_AS_STRING(Text)[0];
  return C != '\\' && C != '#';
}

bool textIs(PyObject *Text, const char *Word) {
  size_t N = std::strlen(Word);
  return static_cast<size_t>(PyString_GET_SIZE(Text)) == N &&
         std::memcmp(PyString_AS_STRING(Text), Word, N) == 0;
}

} // namespace

PyObject *nextNonRemovedTokenInLogical(LogicalLineObject *L, Py_ssize_t I) {
  for (Py_ssize_t J = I + 1; J < L->TokenCount; ++J) {
    PyObject *T = L->Texts[J] ? L->Texts[J] : Py_None;
    if (isKeptToken(T))
      return T;
  }
  return nullptr;
}

PyObject *nextNonRemovedTokenInList(PyObject *TokList, Py_ssize_t I) {
  Py_ssize_t N = PyObject_Size(TokList);
  if (N < 0)
    throw tl::PyErrSet();
  tl::expectType(PyList_Check(TokList), "list", TokList);
  for (Py_ssize_t J = I + 1; J < PyList_GET_SIZE(TokList); ++J) {
    PyObject *T = PyList_GET_ITEM(TokList, J);
    if (isKeptToken(T))
      return T;
  }
  return nullptr;
}

Ref localScopeDefined(PyObject *Logical) {
  LogicalLineObject *L = requireLogical(Logical);
  PyObject *Candidate = L->LocalScopeDefined;
  if (!Candidate || Candidate == Py_None) {
    Candidate = Py_None;
    const char *Skip1 = nullptr, *Skip2 = nullptr;
    if (L->Kind == 2) {
      Skip1 = "def";
      Skip2 = "async";
    } else if (L->Kind == 1) {
      Skip1 = "class";
    }
    for (Py_ssize_t I = 0; Skip1 && I < L->TokenCount; ++I) {
      PyObject *T = L->Texts[I];
      if (!T || !PyString_Check(T))
        continue;
      if (PyString_GET_SIZE(T) > 0 && PyString_AS_STRING(T)[0] == '\\')
        continue;
      if (textIs(T, Skip1) || (Skip2 && textIs(T, Skip2)))
        continue;
      Candidate = T;
      break;
    }
  }
  if (Candidate != Py_None)
    tl::expectType(PyString_Check(Candidate), "bytes", Candidate);
  return Ref::borrow(Candidate);
}

double nowTime() {
  PyObject *R = PyObject_CallObject(Host.TimeFunc, nullptr);
  double V = R ? PyFloat_AsDouble(R) : -1.0;
  Py_XDECREF(R);
  if (PyErr_Occurred()) {
    PyObject *Where = PyString_FromString("pysource.treelens.GetNowTime");
    PyErr_WriteUnraisable(Where ? Where : Py_None);
    Py_XDECREF(Where);
    return 0.0;
  }
  return V;
}

namespace {

PyObject *newBool(bool V) { return PyBool_FromLong(V); }

PyObject *rec_LogicalCheck(PyObject *, PyObject *Obj) { return newBool(isLogical(Obj)); }

PyObject *rec_RaiseIfNotLogical(PyObject *, PyObject *Obj) {
  return tl::guard<PyObject *>(nullptr, [&] {
    requireLogical(Obj);
    return newBool(false);
  });
}

PyObject *rec_IsWhitespaceLogical(PyObject *, PyObject *Obj) {
  return tl::guard<PyObject *>(nullptr, [&] {
    int Kind = requireLogical(Obj)->Kind;
    return newBool(Kind == 21 || Kind == 22);
  });
}

PyObject *rec_IsScopeStartLogical(PyObject *, PyObject *Obj) {
  return tl::guard<PyObject *>(nullptr, [&] {
    int Kind = requireLogical(Obj)->Kind;
    return newBool(Kind == 2 || Kind == 1);
  });
}

PyObject *rec_GetLogicalTokenText(PyObject *, PyObject *Args) {
  return tl::guard<PyObject *>(nullptr, [&] {
    PyObject *Logical;
    Py_ssize_t I;
    if (!PyArg_ParseTuple(Args, "On:GetLogicalTokenText", &Logical, &I))
      throw tl::PyErrSet();
    return Ref::borrow(logicalTokenText(requireLogical(Logical), I)).release();
  });
}

PyObject *rec_GetParentScopeLogical(PyObject *, PyObject *Obj) {
  return tl::guard<PyObject *>(nullptr, [&] {
    return Ref::borrow(parentScopeLogical(requireLogical(Obj))).release();
  });
}

PyObject *rec_GetLocalScopeDefined(PyObject *, PyObject *Obj) {
  return tl::guard<PyObject *>(nullptr, [&] { return localScopeDefined(Obj).release(); });
}

PyObject *rec_SetLogicalLocalScopeDefined(PyObject *, PyObject *Args) {
  return tl::guard<PyObject *>(nullptr, [&] {
    PyObject *Logical, *Name;
    if (!PyArg_ParseTuple(Args, "OO:SetLogicalLocalScopeDefined", &Logical, &Name))
      throw tl::PyErrSet();
    requireLogical(Logical);
    // Through the record's own setter, which keeps the record visible to the
    // collector when it is given something other than a name.
    tl::requireStatus(PyObject_SetAttrString(Logical, "fLocalScopeDefined", Name));
    Py_RETURN_NONE;
  });
}

PyObject *rec_GetParentScope(PyObject *, PyObject *Scope) {
  if (!PyString_Check(Scope)) {
    PyErr_Format(PyExc_TypeError, "expected bytes, %.200s found", Py_TYPE(Scope)->tp_name);
    return nullptr;
  }
  Py_ssize_t N = PyString_GET_SIZE(Scope);
  if (N == 0)
    Py_RETURN_NONE;
  const char *S = PyString_AS_STRING(Scope);
  const char *Dot = static_cast<const char *>(memrchr(S, '.', N));
  return PyString_FromStringAndSize(S, Dot ? Dot - S : 0);
}

PyObject *rec_PySet_InplaceOr(PyObject *, PyObject *Args) {
  return tl::guard<PyObject *>(nullptr, [&] {
    PyObject *TheSet, *ToAdd;
    if (!PyArg_ParseTuple(Args, "OO:PySet_InplaceOr", &TheSet, &ToAdd))
      throw tl::PyErrSet();
    Py_ssize_t Before = PyObject_Size(TheSet);
    if (Before < 0)
      throw tl::PyErrSet();
    Ref Result = tl::require(PyNumber_InPlaceOr(TheSet, ToAdd));
    tl::expectType(PySet_Check(Result.get()), "set", Result.get());
    Py_ssize_t After = PySet_GET_SIZE(Result.get());
    return newBool(Before != After);
  });
}

PyObject *rec_ULongLongValueForDoubleBits(PyObject *, PyObject *Arg) {
  double D = PyFloat_AsDouble(Arg);
  if (D == -1.0 && PyErr_Occurred())
    return nullptr;
  unsigned long long U;
  std::memcpy(&U, &D, sizeof U);
  return PyLong_FromUnsignedLongLong(U);
}

PyObject *rec_DoubleValueForULongLongBits(PyObject *, PyObject *Arg) {
  return tl::guard<PyObject *>(nullptr, [&] {
    Ref Index = tl::require(PyNumber_Index(Arg));
    Ref Long = tl::require(PyNumber_Long(Index.get()));
    unsigned long long U = PyLong_AsUnsignedLongLong(Long.get());
    if (U == static_cast<unsigned long long>(-1) && PyErr_Occurred())
      throw tl::PyErrSet();
    double D;
    std::memcpy(&D, &U, sizeof D);
    return PyFloat_FromDouble(D);
  });
}

PyObject *rec_DoubleValueForPyIntBits(PyObject *, PyObject *Arg) {
  unsigned long long U = 0;
  bool Ok = false;
  if (PyInt_Check(Arg) || PyLong_Check(Arg) || PyIndex_Check(Arg)) {
    PyObject *Index = PyNumber_Index(Arg);
    PyObject *Long = Index ? PyNumber_Long(Index) : nullptr;
    if (Long) {
      U = PyLong_AsUnsignedLongLongMask(Long);
      Ok = !(U == static_cast<unsigned long long>(-1) && PyErr_Occurred());
    }
    Py_XDECREF(Index);
    Py_XDECREF(Long);
  }
  if (!Ok) {
    PyErr_Clear();
    return PyFloat_FromDouble(-1.0);
  }
  double D;
  std::memcpy(&D, &U, sizeof D);
  return PyFloat_FromDouble(D);
}

PyObject *rec_GetNowTime(PyObject *, PyObject *) { return PyFloat_FromDouble(nowTime()); }

PyObject *rec_OutOfTime(PyObject *, PyObject *Arg) {
  double End = PyFloat_AsDouble(Arg);
  if (End == -1.0 && PyErr_Occurred())
    return nullptr;
  return newBool(nowTime() >= End);
}

PyObject *rec_LocationsEqual(PyObject *, PyObject *Args) {
  PyObject *A, *B;
  if (!PyArg_ParseTuple(Args, "OO:LocationsEqual", &A, &B))
    return nullptr;
  return newBool(A == B);
}

} // namespace

PyMethodDef RecordFunctions[] = {
    {"LogicalCheck", rec_LogicalCheck, METH_O,
     "LogicalCheck(obj) -> bool: whether type(obj) is exactly the logical-line type"},
    {"RaiseIfNotLogical", rec_RaiseIfNotLogical, METH_O,
     "RaiseIfNotLogical(obj) -> False; raises TypeError unless obj is a logical-line record"},
    {"IsWhitespaceLogical", rec_IsWhitespaceLogical, METH_O,
     "IsWhitespaceLogical(logical) -> bool: a comment-only or blank logical"},
    {"IsScopeStartLogical", rec_IsScopeStartLogical, METH_O,
     "IsScopeStartLogical(logical) -> bool: a def or class logical"},
    {"GetLogicalTokenText", rec_GetLogicalTokenText, METH_VARARGS,
     "GetLogicalTokenText(logical, i) -> bytes: text of token i"},
    {"GetParentScopeLogical", rec_GetParentScopeLogical, METH_O,
     "GetParentScopeLogical(logical) -> the enclosing scope's logical, or None"},
    {"GetLocalScopeDefined", rec_GetLocalScopeDefined, METH_O,
     "GetLocalScopeDefined(logical) -> bytes or None: name of the scope a def or class logical defines"},
    {"SetLogicalLocalScopeDefined", rec_SetLogicalLocalScopeDefined, METH_VARARGS,
     "SetLogicalLocalScopeDefined(logical, name): caches the name of the scope the logical defines"},
    {"GetParentScope", rec_GetParentScope, METH_O,
     "GetParentScope(scope) -> bytes or None: the dotted scope name without its last part"},
    {"PySet_InplaceOr", rec_PySet_InplaceOr, METH_VARARGS,
     "PySet_InplaceOr(the_set, to_add) -> bool: in-place union; whether anything was added"},
    {"ULongLongValueForDoubleBits", rec_ULongLongValueForDoubleBits, METH_O,
     "ULongLongValueForDoubleBits(d) -> int with the bit pattern of the double d"},
    {"DoubleValueForULongLongBits", rec_DoubleValueForULongLongBits, METH_O,
     "DoubleValueForULongLongBits(u) -> float with the bit pattern of the unsigned 64-bit u"},
    {"DoubleValueForPyIntBits", rec_DoubleValueForPyIntBits, METH_O,
     "DoubleValueForPyIntBits(i) -> float with the bit pattern of i modulo 2**64; -1.0 for a non-integer"},
    {"GetNowTime", rec_GetNowTime, METH_NOARGS, "GetNowTime() -> float: the host's current time"},
    {"OutOfTime", rec_OutOfTime, METH_O, "OutOfTime(end_time) -> bool: whether end_time has been reached"},
    {"LocationsEqual", rec_LocationsEqual, METH_VARARGS,
     "LocationsEqual(loc1, loc2) -> bool: whether both are the same object"},
    {nullptr, nullptr, 0, nullptr}};

} // namespace host
} // namespace treelens
