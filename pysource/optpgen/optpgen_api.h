// The native interface of pysource.optpgen used by native converters.
//
// A native subclass of NodeConverter stores its convert function in the
// object's NativeConvert field (typically in tp_new). The parser calls it
// directly, with no Python method lookup, unless the object's type defines a
// Python-level `convert` that overrides NodeConverter.convert; then it calls
// that method with (grammar, node_type, value, context, children). A
// `convert` method that a static (C-level) type defines in its method table
// is taken to do what its NativeConvert does and is not an override. The
// type lookup is made when the parser is created and at each setup().
#ifndef TREELENS_OPTPGEN_API_H
#define TREELENS_OPTPGEN_API_H

#include <Python.h>

namespace optpgen {

/// Converter callback: returns a new reference to the node to insert, Py_None
/// (new reference) to drop it, or NULL with an exception set. Value is the
/// token text for a token and None for a nonterminal; Children is a list
/// (the callee may keep it) for a nonterminal and None for a token. All four
/// object arguments are borrowed.
typedef PyObject *(*ConvertFunc)(PyObject *Converter, PyObject *Grammar,
                                 int NodeType, PyObject *Value,
                                 PyObject *Context, PyObject *Children);

/// Instance layout of pysource.optpgen.NodeConverter; subclasses extend it.
struct NodeConverterObject {
  PyObject_HEAD
  ConvertFunc NativeConvert; ///< NULL: the Python-level convert is called
};

/// Direct entry points of a Parser for native drivers, published as the
/// capsule "pysource.optpgen._C_API". Each does what the Python method of the
/// same name does, with no argument tuple or method lookup per call. All
/// object arguments are borrowed.
struct ParserApi {
  int Version;
  PyTypeObject *ParserType;
  PyTypeObject *NodeConverterType;
  PyObject *ParseError; ///< the ParseError exception type
  /// Parser.setup(start): 0, or -1 with an exception set.
  int (*Setup)(PyObject *Parser, int Start);
  /// Parser.addtoken(type, value, context): 1 when the input is complete, 0
  /// when more is expected, -1 with an exception set (ParseError for input
  /// the grammar rejects).
  int (*AddToken)(PyObject *Parser, int Type, PyObject *Value, PyObject *Context);
  /// Parser.getrootnode(): new reference, or NULL with an exception set.
  PyObject *(*GetRootNode)(PyObject *Parser);
};

constexpr int kParserApiVersion = 1;
constexpr const char *kParserCapsuleName = "pysource.optpgen._C_API";

} // namespace optpgen

#endif
