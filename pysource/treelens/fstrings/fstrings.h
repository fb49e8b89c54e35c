// F-strings: CFStringSupport and the analyzer's inspection of f-string tokens.
#ifndef TREELENS_FSTRINGS_FSTRINGS_H
#define TREELENS_FSTRINGS_FSTRINGS_H

#include "pyref.h"

#include <vector>

namespace treelens {
namespace fstrings {

TL_HIDDEN PyTypeObject &fstringSupportType();

/// One expression of an f-string: its text (null when the caller asked for
/// none), its byte offset and the logical-line record of its tokens.
struct ExprItem {
  tl::Ref Text;
  Py_ssize_t Pos;
  tl::Ref Logical;
};

/// IsFString: a STRING token whose prefix letters are f, fr or rf in any case.
TL_HIDDEN bool isFString(PyObject *Tok);

/// Support.GetExpressionPartList(Tok), a Python override honoured. Item texts
/// are built only when WantText is set or an override supplies them.
TL_HIDDEN std::vector<ExprItem> expressionPartList(PyObject *Support, PyObject *Tok, bool WantText);

/// CPGenAnalyzerImpl._InspectFStringTokens(logical, in_async_def): analyzes
/// the expressions of the logical's f-strings. Throws PyErrSet.
TL_HIDDEN void inspectFStringTokens(PyObject *Analyzer, PyObject *Logical, bool InAsyncDef);

/// Method-table entries of the analyzer: _InspectFStringTokens and
/// _InspectSingleFStringToken.
TL_HIDDEN PyObject *analyzer_InspectFStringTokens(PyObject *Self, PyObject *Args, PyObject *Kwds);
TL_HIDDEN PyObject *analyzer_InspectSingleFStringToken(PyObject *Self, PyObject *Args, PyObject *Kwds);

/// Readies CFStringSupport; -1 on failure.
TL_HIDDEN int initFStringTypes(PyObject *Module);

} // namespace fstrings
} // namespace treelens

#endif
