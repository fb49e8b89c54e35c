// A record's tokens laid out for reading names one line at a time.
#ifndef TREELENS_FASTACCESS_LINETABLE_H
#define TREELENS_FASTACCESS_LINETABLE_H

#include "pysource/_fastaccess/internal.h"

namespace fastaccess {

/// New reference: (texts, lines, cols, comments, match, ascii) of a record (see
/// GetLogicalLineTable's doc string); throws on failure.
TL_HIDDEN tl::Ref lineTable(PyObject *Logical);

/// New reference: (defines_at, reads_at), the (line, col) or None of each
/// name of the sequences Defines and Reads (bytes) in the record's tokens.
TL_HIDDEN tl::Ref lineNameColumns(PyObject *Logical, PyObject *Defines, PyObject *Reads);

} // namespace fastaccess

#endif
