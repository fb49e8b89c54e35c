// Logical-line splitting: statement boundaries, kinds and parent scopes by indentation.
#include "tokenize/splitter.h"

#include <algorithm>
#include <cstring>
#include <new>

namespace tokcore {

namespace {

bool nameIs(const char *Buf, const SplitToken &T, const char *Word) {
  size_t N = std::strlen(Word);
  return T.Type == TokenKind::NAME && T.End - T.Start == N &&
         std::memcmp(Buf + T.Start, Word, N) == 0;
}

/// Keywords that only begin statements: valid code never has them inside brackets.
bool isStatementOnlyKeyword(const char *P, size_t N) {
  static const char *const Words[] = {
      "def",   "class", "return", "pass",  "break", "continue", "raise",
      "try",   "except", "finally", "while", "with",  "del",     "global",
      "assert", "elif",  "import"};
  for (const char *W : Words)
    if (std::strlen(W) == N && std::memcmp(W, P, N) == 0)
      return true;
  return false;
}

class Splitter {
public:
  Splitter(const char *Buf, size_t Len, SplitResult &Out)
      : Buf(Buf), L(Buf, Len, bomLength(Buf, Len)), Out(Out) {}

  void run() {
    while (!L.atEnd()) {
      SplitLogical G{};
      G.TextStart = L.Pos;
      G.FirstLine = static_cast<long>(L.Line);
      G.FirstToken = Out.Tokens.size();
      G.Parent = -1;
      size_t After;
      G.Indent = indentColumn(Buf, L.Len, L.Pos, &After);
      L.Pos = After;
      if (L.atLineEnd()) {
        G.Kind = kKindBlank;
        L.consumeLineEnd();
        addWhitespace(G);
      } else if (Buf[L.Pos] == '#') {
        Token T;
        L.scan(T);
        addToken(T, G);
        L.consumeLineEnd();
        G.Kind = kKindComment;
        addWhitespace(G);
      } else {
        statement(G);
      }
    }
    resolvePending(0);
  }

private:
  struct Scope {
    long Indent;
    long Index;
  };
  /// A comment or blank logical whose parent waits for the next statement.
  struct Waiting {
    size_t Index;
    size_t Depth; ///< scope-stack depth of Candidate (0: none)
    long Candidate;
  };

  void addToken(const Token &T, const SplitLogical &G) {
    // Filled in place: a token built on the stack and copied stalls on store forwarding.
    Out.Tokens.emplace_back();
    SplitToken &S = Out.Tokens.back();
    S.Start = T.Start;
    S.End = T.End;
    S.Row = static_cast<int32_t>(T.Line - static_cast<size_t>(G.FirstLine));
    S.Col = static_cast<int32_t>(T.Col);
    S.Type = T.Type;
  }

  /// True when the physical line at L.Pos starts with a statement-only keyword.
  bool startsStatement() const {
    Lexer P = L;
    P.skipBlanks();
    if (P.atLineEnd())
      return false;
    size_t End;
    if (P.peek(&End) != TokenKind::NAME)
      return false;
    if (isStatementOnlyKeyword(Buf + P.Pos, End - P.Pos))
      return true;
    if (End - P.Pos != 5 || std::memcmp(Buf + P.Pos, "async", 5) != 0)
      return false;
    P.Pos = End;
    P.skipBlanks();
    if (P.atLineEnd() || P.peek(&End) != TokenKind::NAME)
      return false;
    return End - P.Pos == 3 && std::memcmp(Buf + P.Pos, "def", 3) == 0;
  }

  // LOGICAL: tokens up to a line end outside brackets and not after a
  // continuation backslash.
  void statement(SplitLogical &G) {
    long Depth = 0;
    bool Continued = false;
    for (;;) {
      L.skipBlanks();
      if (L.atLineEnd()) {
        if (L.atEnd())
          break;
        L.consumeLineEnd();
        if (!Continued && Depth == 0)
          break;
        Continued = false;
        if (Depth > 0 && startsStatement())
          break;
        continue;
      }
      Token T;
      L.scan(T);
      addToken(T, G);
      switch (T.Type) {
      case TokenKind::LPAR:
      case TokenKind::LSQB:
      case TokenKind::LBRACE: ++Depth; break;
      case TokenKind::RPAR:
      case TokenKind::RSQB:
      case TokenKind::RBRACE:
        if (Depth > 0)
          --Depth;
        break;
      default: break;
      }
      Continued = T.Type == TokenKind::CONTINUATION;
    }
    G.TextEnd = L.Pos;
    G.TokenCount = Out.Tokens.size() - G.FirstToken;
    G.Kind = kindOf(G);
    while (!Stack.empty() && Stack.back().Indent >= G.Indent)
      Stack.pop_back();
    resolvePending(Stack.size());
    G.Parent = Stack.empty() ? -1 : Stack.back().Index;
    long Index = static_cast<long>(Out.Logicals.size());
    Out.Logicals.push_back(G);
    if (G.Kind == kKindDef || G.Kind == kKindClass)
      Stack.push_back({G.Indent, Index});
  }

  int kindOf(const SplitLogical &G) const {
    size_t I = G.FirstToken, E = G.FirstToken + G.TokenCount;
    auto Skip = [&] {
      while (I < E && Out.Tokens[I].Type == TokenKind::CONTINUATION)
        ++I;
    };
    Skip();
    if (I == E)
      return kKindOther;
    const SplitToken &T = Out.Tokens[I];
    if (nameIs(Buf, T, "def"))
      return kKindDef;
    if (nameIs(Buf, T, "class"))
      return kKindClass;
    if (nameIs(Buf, T, "try"))
      return kKindTry;
    if (nameIs(Buf, T, "async")) {
      ++I;
      Skip();
      if (I < E && nameIs(Buf, Out.Tokens[I], "def"))
        return kKindDef;
    }
    return kKindOther;
  }

  void addWhitespace(SplitLogical &G) {
    G.TextEnd = L.Pos;
    G.TokenCount = Out.Tokens.size() - G.FirstToken;
    // Scope indents strictly increase up the stack.
    auto It = std::lower_bound(Stack.begin(), Stack.end(), G.Indent,
                               [](const Scope &S, long I) { return S.Indent < I; });
    size_t Depth = static_cast<size_t>(It - Stack.begin());
    Pending.push_back({Out.Logicals.size(), Depth, Depth ? Stack[Depth - 1].Index : -1});
    Out.Logicals.push_back(G);
  }

  /// Gives the waiting logicals their parents once the scope stack is cut to Depth.
  void resolvePending(size_t Depth) {
    long Common = Depth ? Stack[Depth - 1].Index : -1;
    for (const Waiting &W : Pending)
      Out.Logicals[W.Index].Parent = W.Depth > Depth ? W.Candidate : Common;
    Pending.clear();
  }

  const char *Buf;
  Lexer L;
  SplitResult &Out;
  std::vector<Scope> Stack;
  std::vector<Waiting> Pending;
};

} // namespace

TokStatus splitLogicals(const char *Buf, size_t Len, SplitResult &Out) {
  Out.Tokens.clear();
  Out.Logicals.clear();
  if (Len > kMaxTextSize)
    return TokStatus::TooLarge;
  try {
    Out.Tokens.reserve(Len / 4 + 16);
    Out.Logicals.reserve(Len / 24 + 4);
    Splitter(Buf, Len, Out).run();
  } catch (const std::bad_alloc &) {
    Out.Tokens.clear();
    Out.Logicals.clear();
    return TokStatus::NoMemory;
  }
  return TokStatus::OK;
}

} // namespace tokcore
