// NodeConverter: Python-visible convert() over the native slot, and the
// lookup that lets parsers skip Python for native converters.
#include "converter.h"

#include "messages.h"
#include "native/common/typedesc.h"

#include <structmember.h>

namespace optpgen {

PyTypeObject NodeConverterType;
PyTypeObject NoOpConverterType;
PyObject *ConvertName = nullptr;

namespace {

using tl::guard;
using tl::Ref;

/// NodeConverter's own convert descriptor (borrowed from its type dict).
PyObject *BaseConvert = nullptr;

NodeConverterObject *asConverter(PyObject *O) {
  return reinterpret_cast<NodeConverterObject *>(O);
}

PyObject *converter_new(PyTypeObject *Type, PyObject *, PyObject *) {
  PyObject *Self = Type->tp_alloc(Type, 0);
  if (Self)
    asConverter(Self)->NativeConvert = nullptr;
  return Self;
}

/// convert(grammar, node_type, value, context, children): the native slot,
/// else NotImplementedError.
PyObject *converter_convert(PyObject *Self, PyObject *Args) {
  return guard<PyObject *>(nullptr, [&] {
    PyObject *Grammar, *Value, *Context, *Children;
    int NodeType;
    if (!PyArg_ParseTuple(Args, "OiOOO:convert", &Grammar, &NodeType, &Value,
                          &Context, &Children))
      throw tl::PyErrSet();
    ConvertFunc F = asConverter(Self)->NativeConvert;
    if (!F)
      tl::raiseFormat(PyExc_NotImplementedError, msg::ConvertMissing,
                      Py_TYPE(Self)->tp_name);
    return F(Self, Grammar, NodeType, Value, Context, Children);
  });
}

PyMethodDef ConverterMethods[] = {
    {"convert", converter_convert, METH_VARARGS,
     "convert(grammar, node_type, value, context, children) -> node or None\n\n"
     "Called by the parser for every shifted token (value: the token text, "
     "children: None) and every completed nonterminal (value: None, "
     "children: a new list). None drops the node."},
    {nullptr, nullptr, 0, nullptr}};

/// Counts its calls; keeps a token as its text and a nonterminal as its
/// children list, or drops every node.
struct NoOpConverterObject {
  NodeConverterObject Base;
  long Tokens;
  long Nodes;
  bool Drop;
};

PyObject *noOpConvert(PyObject *Self, PyObject *, int, PyObject *Value,
                      PyObject *, PyObject *Children) {
  auto *C = reinterpret_cast<NoOpConverterObject *>(Self);
  PyObject *Result = Children == Py_None ? Value : Children;
  if (Children == Py_None)
    ++C->Tokens;
  else
    ++C->Nodes;
  if (C->Drop)
    Result = Py_None;
  Py_INCREF(Result);
  return Result;
}

PyObject *noop_new(PyTypeObject *Type, PyObject *Args, PyObject *Kw) {
  PyObject *Drop = Py_False;
  static const char *Names[] = {"drop", nullptr};
  if (!PyArg_ParseTupleAndKeywords(Args, Kw, "|O:_NoOpConverter",
                                   const_cast<char **>(Names), &Drop))
    return nullptr;
  int DropAll = PyObject_IsTrue(Drop);
  if (DropAll < 0)
    return nullptr;
  PyObject *Self = converter_new(Type, Args, Kw);
  if (Self) {
    auto *C = reinterpret_cast<NoOpConverterObject *>(Self);
    C->Base.NativeConvert = noOpConvert;
    C->Tokens = C->Nodes = 0;
    C->Drop = DropAll != 0;
  }
  return Self;
}

/// Its own convert entry (the base one's code), as a native converter type
/// defines it: the parser still calls the slot directly.
PyMethodDef NoOpMethods[] = {
    {"convert", converter_convert, METH_VARARGS,
     "convert(grammar, node_type, value, context, children) -> text, "
     "children or None"},
    {nullptr, nullptr, 0, nullptr}};

PyMemberDef NoOpMembers[] = {
    {const_cast<char *>("tokens"), T_LONG, offsetof(NoOpConverterObject, Tokens),
     READONLY, const_cast<char *>("tokens converted so far")},
    {const_cast<char *>("nodes"), T_LONG, offsetof(NoOpConverterObject, Nodes),
     READONLY, const_cast<char *>("nonterminals converted so far")},
    {nullptr, 0, 0, 0, nullptr}};

/// True for a method defined in C by a static type. Method descriptors have
/// the type of NodeConverter's own convert.
bool isNativeMethod(PyObject *D) {
  return Py_TYPE(D) == Py_TYPE(BaseConvert) &&
         !(reinterpret_cast<PyMethodDescrObject *>(D)->d_type->tp_flags &
           Py_TPFLAGS_HEAPTYPE);
}

} // namespace

ConvertFunc nativeConvertOf(PyObject *Converter) {
  if (!PyObject_TypeCheck(Converter, &NodeConverterType))
    return nullptr;
  ConvertFunc F = asConverter(Converter)->NativeConvert;
  if (!F)
    return nullptr;
  PyObject *D = _PyType_Lookup(Py_TYPE(Converter), ConvertName);
  return D == BaseConvert || (D && isNativeMethod(D)) ? F : nullptr;
}

int initConverters(PyObject *Module) {
  ConvertName = PyString_InternFromString("convert");
  if (!ConvertName)
    return -1;

  tl::TypeDesc D;
  D.Name = "pysource.optpgen.NodeConverter";
  D.Doc = "NodeConverter()\n\nBase type of the converters a Parser calls back. "
          "A native subclass sets the C-level convert slot; a Python subclass "
          "overrides convert().";
  D.Size = sizeof(NodeConverterObject);
  D.Methods = ConverterMethods;
  D.New = converter_new;
  if (tl::readyType(NodeConverterType, D) < 0)
    return -1;
  BaseConvert = _PyType_Lookup(&NodeConverterType, ConvertName);

  tl::TypeDesc N;
  N.Name = "pysource.optpgen._NoOpConverter";
  N.Doc = "_NoOpConverter(drop=False)\n\nA native converter for tests and "
          "benchmarks: a token becomes its text, a nonterminal its children "
          "list (with drop, every node is dropped); calls are counted in "
          "`tokens` and `nodes`.";
  N.Size = sizeof(NoOpConverterObject);
  N.Base = &NodeConverterType;
  N.Members = NoOpMembers;
  N.Methods = NoOpMethods;
  N.New = noop_new;
  if (tl::readyType(NoOpConverterType, N) < 0)
    return -1;

  if (tl::addType(Module, "NodeConverter", NodeConverterType) < 0 ||
      tl::addType(Module, "_NoOpConverter", NoOpConverterType) < 0)
    return -1;
  return 0;
}

} // namespace optpgen
