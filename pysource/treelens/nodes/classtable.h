// The table of native node classes: names, bases, docstrings, grammar rules and operations.
#ifndef TREELENS_NODES_CLASSTABLE_H
#define TREELENS_NODES_CLASSTABLE_H

#include "pysource/treelens/nodes/node.h"

#include <vector>

namespace treelens {

/// One native node class. Rules is a null-terminated list of the grammar rules
/// the class represents (its kSupportedRules), or nullptr to inherit the base's.
/// Methods and Ops are nullptr for a class without operations of its own.
struct NodeClassRow {
  NodeClass Class;
  NodeClass Base;
  const char *Name;
  const char *QualName;
  const char *Doc;
  const char *const *Rules;
  bool Final;
  PyMethodDef *Methods;
  const NodeOps *Ops;
};

/// Every native node class, bases before subclasses.
TL_HIDDEN const std::vector<NodeClassRow> &nodeClassRows();

} // namespace treelens

#endif
