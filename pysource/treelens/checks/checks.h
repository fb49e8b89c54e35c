// Checks CPython makes between parsing and code generation, on one parsed line.
#ifndef TREELENS_CHECKS_CHECKS_H
#define TREELENS_CHECKS_CHECKS_H

#include "pysource/treelens/parse/parse.h"

namespace treelens {
namespace checks {

/// Raises the SyntaxError CPython reports for a line the grammar accepts:
/// targets that cannot be assigned or deleted, malformed call arguments and
/// parameter lists, misplaced starred expressions, and statements outside
/// their block (judged from the record's parent-scope chain). Tree is the
/// line's parse tree (P's grammar); InAsyncDef as given to the analyzer.
TL_HIDDEN void checkLine(ParserObject *P, PyObject *Tree, PyObject *Logical, bool InAsyncDef);

} // namespace checks
} // namespace treelens

#endif
