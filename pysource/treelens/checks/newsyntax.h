// Checks CPython makes after parsing on case clauses' patterns and on type parameter lists.
#ifndef TREELENS_CHECKS_NEWSYNTAX_H
#define TREELENS_CHECKS_NEWSYNTAX_H

#include "pysource/treelens/nodes/node.h"

#include <functional>
#include <string>

namespace treelens {
namespace checks {

/// Receives an error: Parse for the errors CPython's parser reports (they come
/// before the compiler's), the node whose first token locates it, the message.
using ReportFn = std::function<void(bool Parse, NodeObject *At, const std::string &Msg)>;

/// The patterns of a case clause (child 1 of case_block): repeated and
/// unreachable captures, or-patterns that bind different names, two starred
/// names, repeated or misplaced class keywords, `_` as a target or mapping
/// rest, complex literals, repeated mapping keys.
TL_HIDDEN void checkPatterns(NodeObject *Patterns, int Minor, const ReportFn &Report);

/// A type parameter list: a repeated name; from 3.13 (Minor) a parameter
/// without default after one with.
TL_HIDDEN void checkTypeParams(NodeObject *Params, int Minor, const ReportFn &Report);

} // namespace checks
} // namespace treelens

#endif
