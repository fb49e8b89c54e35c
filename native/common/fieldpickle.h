// Pickling of native objects by their field values, guarded by a checksum of the field names.
//
// A type registers its fields once (registerPickle). Its instances, and those
// of its subclasses, then pickle as
//     (_UnpickleFields, (cls, checksum), state)
// where state is the tuple of the field values in alphabetical order of the
// field names, followed by the instance dict when a Python subclass gave the
// object one. Unpickling creates the object with cls.__new__(cls) and
// restores the fields with __setstate__; a checksum that differs from the one
// of the class's current field names raises pickle.PickleError naming both
// checksums and the expected field list.
#ifndef TREELENS_COMMON_FIELDPICKLE_H
#define TREELENS_COMMON_FIELDPICKLE_H

#include "override.h"

#include <structmember.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <string>
#include <unordered_map>
#include <vector>

namespace tl {

/// How a field is stored in the instance.
enum class FieldKind {
  Object, ///< PyObject *, NULL read as None
  Bool,   ///< bool
  Int,    ///< int
  SSize,  ///< Py_ssize_t
  Double, ///< double
};

/// One pickled field. For Object fields, Type (when set) is the type the value
/// must have (subclasses allowed); None is always accepted. ItemType (when
/// set, with Type a list type) is the type every item must have.
struct FieldSpec {
  const char *Name;
  FieldKind Kind;
  Py_ssize_t Offset;
  PyTypeObject *Type = nullptr;
  PyTypeObject *ItemType = nullptr;
};

/// Raises the error of an object that may not be changed now (mid-operation);
/// registered per type, nullptr when it never refuses.
using BusyCheck = void (*)(PyObject *Self);

/// The registered fields of one native type, sorted by name.
struct PickleSpec {
  std::vector<FieldSpec> Fields;
  uint32_t Checksum = 0;
  std::string FieldList; ///< "(a, b, c)"
  BusyCheck Busy = nullptr;
};

/// FNV-1a over the sorted field names, each followed by a comma.
inline uint32_t fieldChecksum(const std::vector<FieldSpec> &Sorted) {
  uint32_t H = 2166136261u;
  for (const FieldSpec &F : Sorted) {
    for (const char *P = F.Name; *P; ++P)
      H = (H ^ static_cast<unsigned char>(*P)) * 16777619u;
    H = (H ^ static_cast<unsigned char>(',')) * 16777619u;
  }
  return H;
}

/// Registered types; one registry per extension module.
inline std::unordered_map<PyTypeObject *, PickleSpec> &pickleRegistry() {
  static std::unordered_map<PyTypeObject *, PickleSpec> Registry;
  return Registry;
}

/// The spec of T or of its nearest registered base; nullptr when none.
inline const PickleSpec *pickleSpecFor(PyTypeObject *T) {
  auto &Reg = pickleRegistry();
  for (; T; T = T->tp_base) {
    auto It = Reg.find(T);
    if (It != Reg.end())
      return &It->second;
  }
  return nullptr;
}

inline char *fieldAddress(PyObject *Self, const FieldSpec &F) {
  return reinterpret_cast<char *>(Self) + F.Offset;
}

/// New reference: the value of one field.
inline Ref getField(PyObject *Self, const FieldSpec &F) {
  char *A = fieldAddress(Self, F);
  switch (F.Kind) {
  case FieldKind::Object: {
    PyObject *O = *reinterpret_cast<PyObject **>(A);
    return Ref::borrow(O ? O : Py_None);
  }
  case FieldKind::Bool:
    return Ref::borrow(*reinterpret_cast<bool *>(A) ? Py_True : Py_False);
  case FieldKind::Int:
    return require(PyInt_FromLong(*reinterpret_cast<int *>(A)));
  case FieldKind::SSize:
    return require(PyInt_FromSsize_t(*reinterpret_cast<Py_ssize_t *>(A)));
  case FieldKind::Double:
    return require(PyFloat_FromDouble(*reinterpret_cast<double *>(A)));
  }
  return Ref::borrow(Py_None);
}

/// Raises TypeError unless Value (borrowed) may be stored in an Object field.
inline void checkObjectField(const FieldSpec &F, PyObject *Value) {
  if (F.Kind != FieldKind::Object || Value == Py_None)
    return;
  if (F.Type && !PyObject_TypeCheck(Value, F.Type))
    raiseFormat(PyExc_TypeError, "Cannot convert %.200s to %.200s", Py_TYPE(Value)->tp_name,
                F.Type->tp_name);
  if (F.ItemType && PyList_Check(Value))
    for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Value); ++I) {
      PyObject *Item = PyList_GET_ITEM(Value, I);
      if (!PyObject_TypeCheck(Item, F.ItemType))
        raiseFormat(PyExc_TypeError, "Cannot convert %.200s to %.200s in %.200s",
                    Py_TYPE(Item)->tp_name, F.ItemType->tp_name, F.Name);
    }
}

/// Stores Value (borrowed) into one field after checking its type.
inline void setField(PyObject *Self, const FieldSpec &F, PyObject *Value) {
  char *A = fieldAddress(Self, F);
  switch (F.Kind) {
  case FieldKind::Object: {
    checkObjectField(F, Value);
    PyObject *Old = *reinterpret_cast<PyObject **>(A);
    Py_INCREF(Value);
    *reinterpret_cast<PyObject **>(A) = Value == Py_None ? nullptr : Value;
    if (Value == Py_None)
      Py_DECREF(Value);
    Py_XDECREF(Old);
    return;
  }
  case FieldKind::Bool:
    *reinterpret_cast<bool *>(A) = requireStatus(PyObject_IsTrue(Value)) != 0;
    return;
  case FieldKind::Int: {
    long V = PyInt_AsLong(Value);
    if (V == -1 && PyErr_Occurred())
      throw PyErrSet();
    *reinterpret_cast<int *>(A) = static_cast<int>(V);
    return;
  }
  case FieldKind::SSize: {
    Py_ssize_t V = PyInt_AsSsize_t(Value);
    if (V == -1 && PyErr_Occurred())
      throw PyErrSet();
    *reinterpret_cast<Py_ssize_t *>(A) = V;
    return;
  }
  case FieldKind::Double: {
    double V = PyFloat_AsDouble(Value);
    if (V == -1.0 && PyErr_Occurred())
      throw PyErrSet();
    *reinterpret_cast<double *>(A) = V;
    return;
  }
  }
}

/// Borrowed: the instance dict of Self, or nullptr.
inline PyObject *instanceDict(PyObject *Self) {
  PyObject **Slot = _PyObject_GetDictPtr(Self);
  return Slot ? *Slot : nullptr;
}

/// The module-level function that unpickling calls; set by registerPickle.
inline PyObject *&unpickleFunction() {
  static PyObject *Func = nullptr;
  return Func;
}

/// __reduce__ for every registered type.
inline PyObject *pickleReduce(PyObject *Self, PyObject *) {
  return guard<PyObject *>(nullptr, [&] {
    const PickleSpec *Spec = pickleSpecFor(Py_TYPE(Self));
    if (!Spec || !unpickleFunction())
      raiseFormat(PyExc_TypeError, "can't pickle %.200s objects", Py_TYPE(Self)->tp_name);
    PyObject *Dict = instanceDict(Self);
    bool WithDict = Dict && PyDict_Size(Dict) > 0;
    Py_ssize_t N = static_cast<Py_ssize_t>(Spec->Fields.size());
    Ref State = require(PyTuple_New(N + (WithDict ? 1 : 0)));
    for (Py_ssize_t I = 0; I < N; ++I)
      PyTuple_SET_ITEM(State.get(), I, getField(Self, Spec->Fields[I]).release());
    if (WithDict) {
      Py_INCREF(Dict);
      PyTuple_SET_ITEM(State.get(), N, Dict);
    }
    return Py_BuildValue("(O(Ok)O)", unpickleFunction(), reinterpret_cast<PyObject *>(Py_TYPE(Self)),
                         static_cast<unsigned long>(Spec->Checksum), State.get());
  });
}

/// __setstate__ for every registered type.
inline PyObject *pickleSetState(PyObject *Self, PyObject *State) {
  return guard<PyObject *>(nullptr, [&] {
    const PickleSpec *Spec = pickleSpecFor(Py_TYPE(Self));
    if (!Spec)
      raiseFormat(PyExc_TypeError, "can't unpickle %.200s objects", Py_TYPE(Self)->tp_name);
    expectType(PyTuple_Check(State), "tuple", State);
    Py_ssize_t N = static_cast<Py_ssize_t>(Spec->Fields.size());
    Py_ssize_t Got = PyTuple_GET_SIZE(State);
    if (Got != N && Got != N + 1)
      raiseFormat(PyExc_ValueError, "%.200s state needs %zd values %.400s, got %zd",
                  Py_TYPE(Self)->tp_name, N, Spec->FieldList.c_str(), Got);
    if (Spec->Busy)
      Spec->Busy(Self);
    // The state tuple is held: a field's old value, released as it is
    // replaced, may run Python code.
    Ref Hold = Ref::borrow(State);
    for (Py_ssize_t I = 0; I < N; ++I)
      checkObjectField(Spec->Fields[I], PyTuple_GET_ITEM(State, I));
    for (Py_ssize_t I = 0; I < N; ++I)
      setField(Self, Spec->Fields[I], PyTuple_GET_ITEM(State, I));
    if (Got == N + 1) {
      PyObject *Extra = PyTuple_GET_ITEM(State, N);
      PyObject **Slot = _PyObject_GetDictPtr(Self);
      if (!Slot)
        raiseFormat(PyExc_TypeError, "%.200s objects have no instance dict", Py_TYPE(Self)->tp_name);
      if (!*Slot)
        *Slot = require(PyDict_New()).release();
      requireStatus(PyDict_Update(*Slot, Extra));
    }
    Py_RETURN_NONE;
  });
}

/// _UnpickleFields(cls, checksum): a new, empty instance of cls.
inline PyObject *unpickleFields(PyObject *, PyObject *Args) {
  return guard<PyObject *>(nullptr, [&]() -> PyObject * {
    PyObject *Cls;
    unsigned long Checksum;
    if (!PyArg_ParseTuple(Args, "Ok:_UnpickleFields", &Cls, &Checksum))
      throw PyErrSet();
    expectType(PyType_Check(Cls), "type", Cls);
    PyTypeObject *T = reinterpret_cast<PyTypeObject *>(Cls);
    const PickleSpec *Spec = pickleSpecFor(T);
    if (!Spec)
      raiseFormat(PyExc_TypeError, "can't unpickle %.200s objects", T->tp_name);
    if (Checksum != Spec->Checksum) {
      Ref Pickle = require(PyImport_ImportModule("pickle"));
      Ref Error = require(PyObject_GetAttrString(Pickle.get(), "PickleError"));
      raiseFormat(Error.get(), "Incompatible checksums (0x%x vs 0x%x = %s)",
                  static_cast<unsigned>(Checksum), static_cast<unsigned>(Spec->Checksum),
                  Spec->FieldList.c_str());
    }
    Ref Empty = require(PyTuple_New(0));
    return T->tp_new(T, Empty.get(), nullptr);
  });
}

/// The PyMethodDef row of the module-level unpickle function.
inline PyMethodDef unpickleMethodDef() {
  return {"_UnpickleFields", reinterpret_cast<PyCFunction>(unpickleFields), METH_VARARGS,
          "_UnpickleFields(cls, checksum) -> a new instance of cls for __setstate__"};
}

/// Registers T's fields (after PyType_Ready) and gives T __reduce__ and
/// __setstate__. UnpickleFunc is the module's _UnpickleFields (borrowed, kept).
inline void registerPickle(PyTypeObject &T, std::vector<FieldSpec> Fields, PyObject *UnpickleFunc,
                           BusyCheck Busy = nullptr) {
  std::sort(Fields.begin(), Fields.end(),
            [](const FieldSpec &A, const FieldSpec &B) { return std::strcmp(A.Name, B.Name) < 0; });
  PickleSpec Spec;
  Spec.Checksum = fieldChecksum(Fields);
  Spec.FieldList = "(";
  for (size_t I = 0; I < Fields.size(); ++I) {
    if (I)
      Spec.FieldList += ", ";
    Spec.FieldList += Fields[I].Name;
  }
  Spec.FieldList += ")";
  Spec.Fields = std::move(Fields);
  Spec.Busy = Busy;
  pickleRegistry()[&T] = std::move(Spec);
  if (!unpickleFunction()) {
    Py_INCREF(UnpickleFunc);
    unpickleFunction() = UnpickleFunc;
  }
  static PyMethodDef Reduce = {"__reduce__", reinterpret_cast<PyCFunction>(pickleReduce),
                               METH_NOARGS, "Pickles the object by its field values."};
  static PyMethodDef SetState = {"__setstate__", reinterpret_cast<PyCFunction>(pickleSetState),
                                 METH_O, "Restores the field values of a pickled object."};
  for (PyMethodDef *M : {&Reduce, &SetState}) {
    Ref Descr = require(PyDescr_NewMethod(&T, M));
    requireStatus(PyDict_SetItemString(T.tp_dict, M->ml_name, Descr.get()));
  }
  PyType_Modified(&T);
}

} // namespace tl

#endif
