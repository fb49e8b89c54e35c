// JoinTokens(texts) of pysource._fastaccess.
#ifndef TREELENS_FASTACCESS_JOINTOKENS_H
#define TREELENS_FASTACCESS_JOINTOKENS_H

#include <Python.h>

#include "pyref.h"

namespace fastaccess {

/// JoinTokens(texts) -> bytes: the token texts joined with conventional spacing.
TL_HIDDEN PyObject *f_join_tokens(PyObject *Self, PyObject *Args, PyObject *Kw);

} // namespace fastaccess

#endif
