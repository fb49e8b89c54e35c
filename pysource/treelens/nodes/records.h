// Plain data records of the node model: CAsName (imported names) and CArgInfo (arguments).
#ifndef TREELENS_NODES_RECORDS_H
#define TREELENS_NODES_RECORDS_H

#include "pyref.h"

namespace treelens {

/// CAsName: one imported name and its alias. NULL fields read as None.
struct AsNameObject {
  PyObject_HEAD
  PyObject *ModuleName; ///< bytes
  PyObject *AsName;     ///< bytes
};

/// CArgInfo: one argument of a definition or a call. NULL fields read as None.
struct ArgInfoObject {
  PyObject_HEAD
  PyObject *Name;     ///< CNode
  PyObject *Value;    ///< CNode
  PyObject *Prefix;   ///< bytes: "*" or "**"
  PyObject *TypeExpr; ///< CNode
};

TL_HIDDEN PyTypeObject &asNameType();
TL_HIDDEN PyTypeObject &argInfoType();

/// Readies CAsName and CArgInfo; -1 on failure.
TL_HIDDEN int initNodeRecordTypes(PyObject *Module);

} // namespace treelens

#endif
