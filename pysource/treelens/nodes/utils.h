// Node and token utilities: token end index, next kept token, tuple/set/generator atoms, dropping
// parentheses, expanding sequence literals and splitting string literals.
#ifndef TREELENS_NODES_UTILS_H
#define TREELENS_NODES_UTILS_H

#include "pysource/treelens/nodes/node.h"

#include <cstddef>

namespace treelens {

/// GetTokenEndIndex: one past the index of Node's last token (its last
/// leaf's fContext + 1). Returns -2 with a Python error set on failure.
TL_HIDDEN Py_ssize_t getTokenEndIndex(PyObject *Node) noexcept;

/// NextNonRemovedTokenInLogical: borrowed text of the first token after I
/// that is neither a comment nor a line continuation, or Py_None. Raises
/// TypeError "Argument must be a logical" unless Logical is a record.
TL_HIDDEN PyObject *nextNonRemovedTokenInLogical(PyObject *Logical, Py_ssize_t I);
/// NextNonRemovedTokenInList: the same over a list of token texts.
TL_HIDDEN PyObject *nextNonRemovedTokenInList(PyObject *TokList, Py_ssize_t I);

/// IsSetLiteral, IsGenExpression, IsTupleExpression of an atom (borrowed,
/// any object: a non-CAtom gives false). Never raise.
TL_HIDDEN bool isSetLiteral(PyObject *Atom);
TL_HIDDEN bool isGenExpression(PyObject *Atom);
TL_HIDDEN bool isTupleExpression(PyObject *Atom);

/// DropSimpleParens: the innermost expression of nested simple parentheses,
/// Node itself otherwise. New reference.
TL_HIDDEN tl::Ref dropSimpleParens(PyObject *Node);

/// ExpandSeqLiteral: the list of element nodes of a bracketed sequence
/// literal, or None. New reference.
TL_HIDDEN tl::Ref expandSeqLiteral(PyObject *Node, bool AnyBracket, bool DropParens = true);

/// Where StripPyQuotes splits a string literal text of Size bytes: the prefix
/// is [0, PrefixLen), the body [PrefixLen, Size - SuffixLen), the suffix the
/// rest. Both lengths are 0 when the text is not a complete literal.
struct QuoteSplit {
  std::size_t PrefixLen;
  std::size_t SuffixLen;
};
TL_HIDDEN QuoteSplit splitPyQuotes(const char *Text, std::size_t Size);

/// StripPyQuotes(txt): the (stripped, prefix, suffix) tuple of byte strings.
/// New reference; TypeError "Expected bytes, got ..." for a non-bytes Txt.
TL_HIDDEN tl::Ref stripPyQuotes(PyObject *Txt);

/// Module functions GetTokenEndIndex, IsSetLiteral, IsGenExpression,
/// IsTupleExpression, DropSimpleParens and StripPyQuotes.
TL_HIDDEN extern PyMethodDef NodeUtilFunctions[];

} // namespace treelens

#endif
