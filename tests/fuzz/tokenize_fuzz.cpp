// libFuzzer target: the splitter's invariants and the lexer's agreement with classifyText.
#include "tokenize/splitter.h"
#include "tokenize/tokenizer.h"

#include <cstdlib>

using namespace tokcore;

namespace {

void check(bool Ok) {
  if (!Ok)
    std::abort();
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *Data, size_t Size) {
  const char *Buf = reinterpret_cast<const char *>(Data);
  SplitResult R;
  check(splitLogicals(Buf, Size, R) == TokStatus::OK);
  // Logicals tile the text after a byte-order mark; tokens lie inside their logical.
  size_t Pos = bomLength(Buf, Size);
  for (size_t I = 0; I < R.Logicals.size(); ++I) {
    const SplitLogical &G = R.Logicals[I];
    check(G.TextStart == Pos && G.TextStart <= G.TextEnd);
    check(G.Parent < static_cast<long>(I));
    check(G.Parent < 0 || R.Logicals[G.Parent].Kind == kKindDef ||
          R.Logicals[G.Parent].Kind == kKindClass);
    Pos = G.TextEnd;
    for (size_t J = 0; J < G.TokenCount; ++J) {
      const SplitToken &T = R.Tokens[G.FirstToken + J];
      check(G.TextStart <= T.Start && T.Start < T.End && T.End <= G.TextEnd);
      check(T.Row >= 0 && T.Col >= 0);
    }
  }
  check(Pos == Size);
  // Every token's text alone classifies as the lexer typed it in context,
  // except a backslash that does not end its line.
  Lexer L(Buf, Size, bomLength(Buf, Size));
  while (!L.atEnd()) {
    L.skipBlanks();
    if (L.atLineEnd()) {
      L.consumeLineEnd();
      continue;
    }
    Token T;
    L.scan(T);
    TokenKind Alone = classifyText(Buf + T.Start, T.End - T.Start);
    check(Alone == T.Type || (Buf[T.Start] == '\\' && T.Type == TokenKind::ERRORTOKEN));
  }
  return 0;
}
