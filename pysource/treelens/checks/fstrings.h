// How CPython 3.6 to 3.8 read the replacement fields of an f-string token.
#ifndef TREELENS_CHECKS_FSTRINGS_H
#define TREELENS_CHECKS_FSTRINGS_H

#include "pyref.h"

#include <string>
#include <vector>

namespace treelens {
namespace checks {

/// The fields of one f-string token, as CPython's compiler scans them.
struct FieldScan {
  struct Expr {
    Py_ssize_t Begin, End; ///< the expression's bytes in the token
  };
  std::vector<Expr> Exprs;   ///< in the order CPython compiles them
  bool Failed = false;       ///< the scan stopped before the token's end
  std::string Error;         ///< the scanner's message; empty when it stopped on what it does not judge
  std::size_t ErrorAfter = 0; ///< expressions compiled before the error
};

/// Scans the f-string token Tok (prefix and quotes included). Py38 selects
/// 3.8's reading: `=` fields and its bracket-matching messages; Py312 3.12's
/// nesting and backslashes in fields (its other rules need its own lexing).
TL_HIDDEN void scanFString(const char *Tok, Py_ssize_t N, bool Py38, bool Py312, FieldScan &Out);

} // namespace checks
} // namespace treelens

#endif
