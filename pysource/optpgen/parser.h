// The Parser type: drives the native pgen engine and builds the tree through
// a converter.
#ifndef TREELENS_OPTPGEN_PARSER_H
#define TREELENS_OPTPGEN_PARSER_H

#include "native/common/pyref.h"
#include "pysource/optpgen/optpgen_api.h"

namespace optpgen {

TL_HIDDEN extern PyTypeObject ParserType;
/// pysource.optpgen.ParseError (new-style class, set at module init).
TL_HIDDEN extern PyObject *ParseErrorType;

/// CreateParser(grammar, converter, promotesinglechild=False).
TL_HIDDEN PyObject *createParser(PyObject *Module, PyObject *Args,
                                 PyObject *Kw);

/// _FeedTokens(parser, tokens): setup(), then addtoken for each (type,
/// value, context) until it returns True; returns the last result.
TL_HIDDEN PyObject *feedTokens(PyObject *Module, PyObject *Args);

/// The native entry points of Parser published as the capsule
/// "pysource.optpgen._C_API" (after ParseErrorType is set).
TL_HIDDEN const ParserApi *parserApi();

/// Readies Parser and adds it to Module; -1 on failure.
TL_HIDDEN int initParser(PyObject *Module);

} // namespace optpgen

#endif
