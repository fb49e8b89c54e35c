// CNodeToTextConverter: renders expression nodes back to the source text the walkers record.
#ifndef TREELENS_NODES_TOTEXT_H
#define TREELENS_NODES_TOTEXT_H

#include "pysource/treelens/nodes/node.h"

namespace treelens {

/// A CNodeToTextConverter (or an instance of a Python subclass).
struct ConverterObject {
  PyObject_HEAD
  bool IncludeBracketText;    ///< _fIncludeBracketText
  bool IncludeStringContents; ///< _fIncludeStringContents
  bool IncludeArgText;        ///< _fIncludeArgText
};

/// The keyword options of TextForNode and TextForAtomPlusTrailers.
struct TextOptions {
  bool DottedNameOnly = false;
  bool DiscardSimpleParens = true;
  bool LiteralOnly = false;
};

TL_HIDDEN PyTypeObject &nodeToTextConverterType();

/// A new converter with the given options. New reference.
TL_HIDDEN tl::Ref newNodeToTextConverter(bool IncludeBracketText, bool IncludeStringContents,
                                         bool IncludeArgText);

// Native callers. Conv is a converter (TypeError otherwise); results are new
// references to a byte string or None; failures throw tl::PyErrSet.

/// TextForNode; calls a Python-level override of TextForNode when Conv's class
/// defines one (its result must be a byte string or None).
TL_HIDDEN tl::Ref textForNode(PyObject *Conv, PyObject *Node, TextOptions Options = TextOptions());
/// TextForAtomPlusTrailers; Trailers must be a list of CTrailer.
TL_HIDDEN tl::Ref textForAtomPlusTrailers(PyObject *Conv, PyObject *Atom, PyObject *Trailers,
                                          TextOptions Options = TextOptions());
/// _TextForStringLiteral of a CStringLiteral.
TL_HIDDEN tl::Ref textForStringLiteral(PyObject *Conv, PyObject *Node);

/// Readies CNodeToTextConverter and adds it to the module; -1 on failure.
TL_HIDDEN int initNodeToTextType(PyObject *Module);

} // namespace treelens

#endif
