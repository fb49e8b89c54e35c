// The native EncodeStringLiteral of pysource.symbolinfo.
#ifndef TREELENS_FASTACCESS_LITERALS_H
#define TREELENS_FASTACCESS_LITERALS_H

#include "pyref.h"

namespace fastaccess {

/// EncodeStringLiteral(text): METH_O.
TL_HIDDEN PyObject *f_encode_string_literal(PyObject *Self, PyObject *Text);

} // namespace fastaccess

#endif
