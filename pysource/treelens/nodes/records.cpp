// CAsName and CArgInfo records.
#include "pysource/treelens/nodes/records.h"

#include "fieldpickle.h"
#include "pysource/treelens/host/host.h"
#include "pysource/treelens/nodes/node.h"
#include "typedesc.h"

namespace treelens {

namespace {

PyTypeObject AsNameType;
PyTypeObject ArgInfoType;

int asname_init(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  static const char *Keywords[] = {nullptr};
  if (!PyArg_ParseTupleAndKeywords(Args, Kwds, ":CAsName", const_cast<char **>(Keywords)))
    return -1;
  auto *A = reinterpret_cast<AsNameObject *>(Self);
  Py_CLEAR(A->ModuleName);
  Py_CLEAR(A->AsName);
  return 0;
}

int asname_traverse(PyObject *Self, visitproc visit, void *arg) {
  auto *A = reinterpret_cast<AsNameObject *>(Self);
  Py_VISIT(A->ModuleName);
  Py_VISIT(A->AsName);
  return 0;
}

int asname_clear(PyObject *Self) {
  auto *A = reinterpret_cast<AsNameObject *>(Self);
  Py_CLEAR(A->ModuleName);
  Py_CLEAR(A->AsName);
  return 0;
}

int arginfo_init(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  static const char *Keywords[] = {nullptr};
  if (!PyArg_ParseTupleAndKeywords(Args, Kwds, ":CArgInfo", const_cast<char **>(Keywords)))
    return -1;
  auto *A = reinterpret_cast<ArgInfoObject *>(Self);
  Py_CLEAR(A->Name);
  Py_CLEAR(A->Value);
  Py_CLEAR(A->Prefix);
  Py_CLEAR(A->TypeExpr);
  return 0;
}

int arginfo_traverse(PyObject *Self, visitproc visit, void *arg) {
  auto *A = reinterpret_cast<ArgInfoObject *>(Self);
  Py_VISIT(A->Name);
  Py_VISIT(A->Value);
  Py_VISIT(A->Prefix);
  Py_VISIT(A->TypeExpr);
  return 0;
}

int arginfo_clear(PyObject *Self) {
  auto *A = reinterpret_cast<ArgInfoObject *>(Self);
  Py_CLEAR(A->Name);
  Py_CLEAR(A->Value);
  Py_CLEAR(A->Prefix);
  Py_CLEAR(A->TypeExpr);
  return 0;
}

/// The field of an ArgInfoObject a getset row stands for, and its type.
struct ArgField {
  Py_ssize_t Offset;
  bool Bytes; ///< a byte string field; otherwise a CNode field
};

const ArgField NameField{offsetof(ArgInfoObject, Name), false};
const ArgField ValueField{offsetof(ArgInfoObject, Value), false};
const ArgField PrefixField{offsetof(ArgInfoObject, Prefix), true};
const ArgField TypeExprField{offsetof(ArgInfoObject, TypeExpr), false};

PyObject **argSlot(PyObject *Self, void *Closure) {
  return reinterpret_cast<PyObject **>(reinterpret_cast<char *>(Self) +
                                       static_cast<const ArgField *>(Closure)->Offset);
}

PyObject *arginfo_get(PyObject *Self, void *Closure) {
  PyObject *V = *argSlot(Self, Closure);
  V = V ? V : Py_None;
  Py_INCREF(V);
  return V;
}

int arginfo_set(PyObject *Self, PyObject *Value, void *Closure) {
  if (!Value)
    Value = Py_None;
  if (Value != Py_None) {
    bool Bytes = static_cast<const ArgField *>(Closure)->Bytes;
    bool Ok = Bytes ? PyString_Check(Value) : isNode(Value);
    if (!Ok && Bytes) {
      PyErr_Format(PyExc_TypeError, "Expected %.16s, got %.200s", "bytes", Py_TYPE(Value)->tp_name);
      return -1;
    }
    if (!Ok) {
      PyErr_Format(PyExc_TypeError, "Cannot convert %.200s to %.200s", Py_TYPE(Value)->tp_name,
                   cnodeType().tp_name);
      return -1;
    }
  }
  PyObject **Slot = argSlot(Self, Closure);
  PyObject *New = Value == Py_None ? nullptr : Value;
  Py_XINCREF(New);
  Py_XSETREF(*Slot, New);
  return 0;
}

PyGetSetDef ArgInfoGetSets[] = {
    {const_cast<char *>("name"), arginfo_get, arginfo_set,
     const_cast<char *>("name node of the parameter or keyword argument"), const_cast<ArgField *>(&NameField)},
    {const_cast<char *>("value"), arginfo_get, arginfo_set,
     const_cast<char *>("default value or argument value"), const_cast<ArgField *>(&ValueField)},
    {const_cast<char *>("prefix"), arginfo_get, arginfo_set,
     const_cast<char *>("'*' or '**' for star parameters and arguments"), const_cast<ArgField *>(&PrefixField)},
    {const_cast<char *>("type_expr"), arginfo_get, arginfo_set,
     const_cast<char *>("annotation of a parameter"), const_cast<ArgField *>(&TypeExprField)},
    {nullptr, nullptr, nullptr, nullptr, nullptr}};

} // namespace

PyTypeObject &asNameType() { return AsNameType; }
PyTypeObject &argInfoType() { return ArgInfoType; }

int initNodeRecordTypes(PyObject *Module) {
  return tl::guard<int>(-1, [&] {
    using F = tl::FieldKind;
    tl::TypeDesc D;
    D.Name = "pysource.treelens.CAsName";
    D.Doc = "Plain data class for imported names";
    D.Size = sizeof(AsNameObject);
    D.Dealloc = tl::gcDealloc<asname_clear>;
    D.Traverse = asname_traverse;
    D.Clear = asname_clear;
    D.Init = asname_init;
    D.New = PyType_GenericNew;
    tl::requireStatus(tl::readyType(AsNameType, D));
    tl::requireStatus(tl::addType(Module, "CAsName", AsNameType));
    tl::registerPickle(AsNameType,
                       {{"module_name", F::Object, offsetof(AsNameObject, ModuleName), &PyString_Type},
                        {"as_name", F::Object, offsetof(AsNameObject, AsName), &PyString_Type}},
                       host::Host.UnpickleFields);

    D = tl::TypeDesc();
    D.Name = "pysource.treelens.CArgInfo";
    D.Doc = "Plain data class for one argument of a definition or a call";
    D.Size = sizeof(ArgInfoObject);
    D.GetSets = ArgInfoGetSets;
    D.Dealloc = tl::gcDealloc<arginfo_clear>;
    D.Traverse = arginfo_traverse;
    D.Clear = arginfo_clear;
    D.Init = arginfo_init;
    D.New = PyType_GenericNew;
    tl::requireStatus(tl::readyType(ArgInfoType, D));
    tl::requireStatus(tl::addType(Module, "CArgInfo", ArgInfoType));
    tl::registerPickle(ArgInfoType,
                       {{"name", F::Object, offsetof(ArgInfoObject, Name), &cnodeType()},
                        {"value", F::Object, offsetof(ArgInfoObject, Value), &cnodeType()},
                        {"prefix", F::Object, offsetof(ArgInfoObject, Prefix), &PyString_Type},
                        {"type_expr", F::Object, offsetof(ArgInfoObject, TypeExpr), &cnodeType()}},
                       host::Host.UnpickleFields);

    return 0;
  });
}

} // namespace treelens
