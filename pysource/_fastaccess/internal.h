// Declarations shared by the source files of pysource._fastaccess.
#ifndef TREELENS_FASTACCESS_INTERNAL_H
#define TREELENS_FASTACCESS_INTERNAL_H

#include "pysource/_fastaccess/fastaccess_api.h"
#include "pyref.h"
#include "tokenize/tokenizer.h"

namespace fastaccess {

/// Error messages of the module; each is API.
namespace msg {
constexpr const char *NotLogical = "Argument must be a logical";
constexpr const char *Index = "Index not in range";
constexpr const char *Tokens = "tokens must be a sequence of (text, (row, col)) pairs";
constexpr const char *TokenText = "token text must be bytes, not %.200s";
constexpr const char *Position = "token position out of range";
constexpr const char *ParentScope = "fParentScope must be a logical or None";
constexpr const char *NoDelete = "can't delete attribute";
constexpr const char *Attrib = "attrib must be bytes or a (name, info) pair, not %.200s";
constexpr const char *Bytes = "bytes";
constexpr const char *NoString = "no string literal starts at position %zd";
constexpr const char *TooLarge = "text too large to tokenize";
constexpr const char *LoggerUnset = "CLogger is not initialized";
} // namespace msg

TL_HIDDEN extern PyTypeObject LogicalLineType;
TL_HIDDEN extern PyTypeObject BytesTokenizerType;
TL_HIDDEN extern PyTypeObject LoggerType;

/// Readies LogicalLineType; -1 with an exception on failure.
TL_HIDDEN int initLogicalLineType();
TL_HIDDEN int initBytesTokenizerType();
TL_HIDDEN int initLoggerType();

/// New reference: a bytes object for a token text, shared for keywords and operators.
TL_HIDDEN tl::Ref tokenText(const char *Text, size_t Len, tokcore::TokenKind Kind);
/// Builds the shared keyword and operator texts; -1 on failure.
TL_HIDDEN int initTokenTextCache();

/// Throws unless Obj is a logical-line record (subclasses included).
TL_HIDDEN LogicalLineObject *asLogical(PyObject *Obj);
/// Throws TypeError "Expected bytes, got <type>" unless Obj is bytes.
TL_HIDDEN void expectBytes(PyObject *Obj);

// Record operations shared by the Python functions and the capsule table.
TL_HIDDEN int clearDerivedInfo(PyObject *Logical);
TL_HIDDEN int appendAttrib(PyObject *Logical, PyObject *Attrib);
TL_HIDDEN int appendTypeEquiv(PyObject *Logical, PyObject *Name, PyObject *Info);
TL_HIDDEN PyObject *tokenizeText(const char *Text, Py_ssize_t Len);
TL_HIDDEN PyObject *splitText(const char *Text, Py_ssize_t Len);
TL_HIDDEN int tokenTypeOfText(const char *Text, Py_ssize_t Len);

/// Raises the Python error for an engine status other than OK.
TL_HIDDEN void raiseStatus(tokcore::TokStatus Status);

} // namespace fastaccess

#endif
