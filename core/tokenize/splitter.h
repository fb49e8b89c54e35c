// Splits Python source bytes into logical lines with tokens, kinds and parent scopes.
#ifndef TREELENS_CORE_SPLITTER_H
#define TREELENS_CORE_SPLITTER_H

#include "tokenize/tokenizer.h"

#include <vector>

namespace tokcore {

/// Kind codes of logical lines.
enum LogicalKind : int {
  kKindOther = 0,
  kKindClass = 1,
  kKindDef = 2,
  kKindTry = 11,
  kKindComment = 21,
  kKindBlank = 22,
};

/// A token of a logical line. Row 0 is the logical's first physical line;
/// Col is the byte offset of Start in the token's own line.
struct SplitToken {
  size_t Start;
  size_t End;
  int32_t Row;
  int32_t Col;
  TokenKind Type;
};

/// A logical line. Invariant: the TextStart..TextEnd spans of consecutive
/// logicals are adjacent and together cover the text after a byte-order mark.
struct SplitLogical {
  size_t TextStart;  ///< first byte of the first physical line
  size_t TextEnd;    ///< past the last physical line's line end
  size_t FirstToken; ///< index into SplitResult::Tokens
  size_t TokenCount;
  long FirstLine; ///< 0-based
  long Indent;    ///< column of the first line's first non-blank byte
  int Kind;
  long Parent; ///< index of the enclosing def/class logical, -1 for none
};

struct SplitResult {
  std::vector<SplitToken> Tokens;
  std::vector<SplitLogical> Logicals;
};

/// Splits Buf[0..Len) into logical lines, replacing Out's contents.
///
/// A logical ends at the line end where its statement ends; open brackets
/// and a trailing backslash carry it on. Comment-only and blank lines outside
/// a statement are logicals of their own. Inside open brackets, a line that
/// starts with a keyword only a statement can start (`def`, `class`,
/// `return`, `import`, ...) starts a new logical: the brackets were never
/// going to close, and the rest of the file still splits as written.
///
/// Parents go by indentation: a statement's parent is the innermost open
/// def/class logical indented less than it. A comment or blank line takes
/// the one its own indentation gives, but never leaves a scope that the
/// next statement is still inside, so a dedented comment in a body stays in it.
TokStatus splitLogicals(const char *Buf, size_t Len, SplitResult &Out);

} // namespace tokcore

#endif
