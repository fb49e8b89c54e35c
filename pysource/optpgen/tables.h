// Compiling grammar objects into shared native parse tables.
#ifndef TREELENS_OPTPGEN_TABLES_H
#define TREELENS_OPTPGEN_TABLES_H

#include "native/common/pyref.h"
#include "pgen/grammar.h"

#include <memory>

namespace optpgen {

using GrammarPtr = std::shared_ptr<const pgen::Grammar>;

/// Tables of a grammar object (symbol2number notation of lib2to3's pgen),
/// compiled on first use and cached for the object's lifetime. Throws
/// PyErrSet (ValueError for a malformed grammar).
TL_HIDDEN GrammarPtr tablesFor(PyObject *GrammarObj);

/// Number of grammar compilations so far (a test hook for the cache).
TL_HIDDEN long tablesBuilt();

/// Sets up the cache; -1 with an exception on failure.
TL_HIDDEN int initTables();

} // namespace optpgen

#endif
