// NodeConverter, the base type of converters, and the test-only no-op one.
#ifndef TREELENS_OPTPGEN_CONVERTER_H
#define TREELENS_OPTPGEN_CONVERTER_H

#include "native/common/pyref.h"
#include "pysource/optpgen/optpgen_api.h"

namespace optpgen {

TL_HIDDEN extern PyTypeObject NodeConverterType;
TL_HIDDEN extern PyTypeObject NoOpConverterType;

/// A METH_KEYWORDS function as a method table entry.
inline PyCFunction kwMethod(PyObject *(*F)(PyObject *, PyObject *,
                                           PyObject *)) {
  return reinterpret_cast<PyCFunction>(reinterpret_cast<void (*)()>(F));
}

/// Interned "convert".
TL_HIDDEN extern PyObject *ConvertName;

/// The native convert function a parser may call for Converter, or null
/// when convert must be called through Python (see optpgen_api.h).
TL_HIDDEN ConvertFunc nativeConvertOf(PyObject *Converter);

/// Readies the converter types and adds them to Module; -1 on failure.
TL_HIDDEN int initConverters(PyObject *Module);

} // namespace optpgen

#endif
