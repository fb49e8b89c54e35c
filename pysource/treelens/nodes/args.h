// Argument lists: the parameter and argument node classes and the flat CArgInfo lists of definitions
// and calls. The CArgInfo layout is ArgInfoObject of records.h.
#ifndef TREELENS_NODES_ARGS_H
#define TREELENS_NODES_ARGS_H

#include "pysource/treelens/nodes/node.h"
#include "pysource/treelens/nodes/records.h"

namespace treelens {

// Slot conventions as in expr.h: new references, failures throw tl::PyErrSet.

/// CFunctionParameterDef: slots 6 to 8.
struct ParameterDefOps : NodeOps {
  virtual tl::Ref getNestedListNode(NodeObject *N) const; ///< c[1] of "(" list ")" or Py_None
  virtual tl::Ref getName(NodeObject *N) const;           ///< the NAME, Py_None for a nested list
  virtual tl::Ref getTypeExpr(NodeObject *N) const;       ///< annotation or Py_None
};

/// CSingleUsedArgumentNode: slots 6 to 9.
struct UsedArgumentOps : NodeOps {
  virtual tl::Ref getPrefix(NodeObject *N) const;             ///< "*" / "**" text or Py_None
  virtual tl::Ref getName(NodeObject *N) const;               ///< keyword name node or Py_None
  virtual tl::Ref getValue(NodeObject *N) const;              ///< value node (the node itself unless keyword)
  virtual bool isUnparenthesizedGenExpr(NodeObject *N) const; ///< never raises
};

// ---- Native callers: new references, throw tl::PyErrSet; honour Python overrides. ----

TL_HIDDEN tl::Ref paramGetNestedListNode(NodeObject *N);
TL_HIDDEN tl::Ref paramGetName(NodeObject *N);
TL_HIDDEN tl::Ref paramGetTypeExpr(NodeObject *N);

TL_HIDDEN tl::Ref usedArgGetPrefix(NodeObject *N);
TL_HIDDEN tl::Ref usedArgGetName(NodeObject *N);
TL_HIDDEN tl::Ref usedArgGetValue(NodeObject *N);
TL_HIDDEN bool usedArgIsUnparenthesizedGenExpr(NodeObject *N); ///< never raises

/// A fresh CArgInfo with all fields None. New reference.
TL_HIDDEN tl::Ref newArgInfo();

/// GetDefiningArgInfoList(node): list of CArgInfo (a nested list for a 2.7
/// tuple parameter). Node is any object (borrowed). New reference.
TL_HIDDEN tl::Ref getDefiningArgInfoList(PyObject *Node);

/// GetUsedArgInfoList(node): flat list of CArgInfo. New reference.
TL_HIDDEN tl::Ref getUsedArgInfoList(PyObject *Node);

/// The ops and Python methods of the argument-list classes (CParametersNode,
/// CFunctionParameterDef, CSingleUsedArgumentNode), for the class table.
TL_HIDDEN const NodeOps *argsClassOps(NodeClass C);
TL_HIDDEN PyMethodDef *argsClassMethods(NodeClass C);

/// Module functions GetDefiningArgInfoList and GetUsedArgInfoList.
TL_HIDDEN extern PyMethodDef ArgListFunctions[];

} // namespace treelens

#endif
