// F-strings: CFStringSupport and the analyzer's inspection of f-string tokens.
#ifndef TREELENS_FSTRINGS_FSTRINGS_H
#define TREELENS_FSTRINGS_FSTRINGS_H

#include "pyref.h"

namespace treelens {
namespace fstrings {

TL_HIDDEN PyTypeObject &fstringSupportType();

/// CPGenAnalyzerImpl._InspectFStringTokens(logical, in_async_def): analyzes
/// the expressions of the logical's f-strings. Throws PyErrSet.
TL_HIDDEN void inspectFStringTokens(PyObject *Analyzer, PyObject *Logical, bool InAsyncDef);

/// Readies CFStringSupport; -1 on failure.
TL_HIDDEN int initFStringTypes(PyObject *Module);

} // namespace fstrings
} // namespace treelens

#endif
