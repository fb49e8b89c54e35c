// The native interface of pysource.optpgen used by native converters.
//
// A native subclass of NodeConverter stores its convert function in the
// object's NativeConvert field (typically in tp_new). The parser calls it
// directly, with no Python method lookup, unless the object's type defines a
// Python-level `convert` that overrides NodeConverter.convert; then it calls
// that method with (grammar, node_type, value, context, children).
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

} // namespace optpgen

#endif
