// Byte tokenizer for Python 2.7 and 3.x source: token types, text classification and a lexer.
#ifndef TREELENS_CORE_TOKENIZER_H
#define TREELENS_CORE_TOKENIZER_H

#include <stddef.h>
#include <stdint.h>

namespace tokcore {

/// Token type codes: the grammar's token numbering (operators as the pgen
/// operator table numbers them) plus the tokenizer's own 201..203.
enum class TokenKind : uint8_t {
  ENDMARKER = 0,
  NAME = 1,
  NUMBER = 2,
  STRING = 3,
  NEWLINE = 4,
  LPAR = 7,
  RPAR = 8,
  LSQB = 9,
  RSQB = 10,
  COLON = 11,
  COMMA = 12,
  SEMI = 13,
  PLUS = 14,
  MINUS = 15,
  STAR = 16,
  SLASH = 17,
  VBAR = 18,
  AMPER = 19,
  LESS = 20,
  GREATER = 21,
  EQUAL = 22,
  DOT = 23,
  PERCENT = 24,
  BACKQUOTE = 25,
  LBRACE = 26,
  RBRACE = 27,
  EQEQUAL = 28,
  NOTEQUAL = 29,
  LESSEQUAL = 30,
  GREATEREQUAL = 31,
  TILDE = 32,
  CIRCUMFLEX = 33,
  LEFTSHIFT = 34,
  RIGHTSHIFT = 35,
  DOUBLESTAR = 36,
  PLUSEQUAL = 37,
  MINEQUAL = 38,
  STAREQUAL = 39,
  SLASHEQUAL = 40,
  PERCENTEQUAL = 41,
  AMPEREQUAL = 42,
  VBAREQUAL = 43,
  CIRCUMFLEXEQUAL = 44,
  LEFTSHIFTEQUAL = 45,
  RIGHTSHIFTEQUAL = 46,
  DOUBLESTAREQUAL = 47,
  DOUBLESLASH = 48,
  DOUBLESLASHEQUAL = 49,
  AT = 50,
  RARROW = 51,
  ELLIPSIS = 52,
  COLONEQUAL = 55, ///< `:=`; 53 and 54 are the grammar's AWAIT and ASYNC
  ATEQUAL = 56,    ///< `@=`, apart from `->` so that no grammar confuses them
  ERRORTOKEN = 201,
  COMMENT = 202,
  CONTINUATION = 203,
};

/// Status codes of the engine entry points.
enum class TokStatus : int { OK = 0, NoMemory = 1, TooLarge = 2 };

/// Largest text the engine accepts: rows and columns must fit 32 bits.
constexpr size_t kMaxTextSize = 0x7fffffff;

/// One token. Invariant: Start < End <= text length; Line/Col locate Start.
struct Token {
  size_t Start;
  size_t End;
  size_t Line; ///< 0-based physical line of Start
  size_t Col;  ///< byte offset of Start in its line
  TokenKind Type;
};

/// Type of the token that Text begins with, from its first bytes alone:
/// "" is ENDMARKER, a line end NEWLINE, a backslash CONTINUATION, white
/// space or a byte that starts no token ERRORTOKEN.
TokenKind classifyText(const char *Text, size_t Len);

/// Length of the operator at Text (1..3), or 0 when none starts there; *Kind
/// receives its type. `!` alone is no operator.
size_t matchOperator(const char *Text, size_t Len, TokenKind *Kind);

/// True for string prefixes (b r u f br rb fr rf ur, any case).
bool isStringPrefix(const char *Text, size_t Len);

/// Offset just past the string literal whose opening quote is at QuotePos;
/// the text's length when the literal is unterminated. A single-quoted
/// literal stops before an unescaped line end; a triple-quoted one runs on
/// to the end of the text. Quotes inside f-string replacement fields are not
/// treated as nested literals.
size_t findStringEnd(const char *Buf, size_t Len, size_t QuotePos);

/// Length of a UTF-8 byte-order mark at the start of Buf (3 or 0).
size_t bomLength(const char *Buf, size_t Len);

/// Offset past the number literal starting at P (a digit, or '.' and a digit).
size_t scanNumber(const char *Buf, size_t Len, size_t P);

namespace detail {
inline bool isNameStart(unsigned char C) {
  return (C >= 'a' && C <= 'z') || (C >= 'A' && C <= 'Z') || C == '_' || C >= 0x80;
}

inline bool isNameChar(unsigned char C) {
  return isNameStart(C) || (C >= '0' && C <= '9');
}

inline bool isDigit(unsigned char C) { return C >= '0' && C <= '9'; }

inline bool isHexDigit(unsigned char C) {
  return isDigit(C) || (C >= 'a' && C <= 'f') || (C >= 'A' && C <= 'F');
}

inline bool isBlank(unsigned char C) { return C == ' ' || C == '\t' || C == '\f'; }

inline bool isLineEnd(unsigned char C) { return C == '\n' || C == '\r'; }
} // namespace detail

/// Scans a text token by token, tracking physical lines.
/// Invariant: Pos <= Len; LineStart <= Pos; Line counts the line ends before LineStart.
class Lexer {
public:
  Lexer(const char *Buf, size_t Len, size_t Pos = 0)
      : Buf(Buf), Len(Len), Pos(Pos), LineStart(Pos) {}

  /// Skips spaces, tabs and form feeds.
  void skipBlanks();
  /// True at the end of the text or at a line end.
  bool atLineEnd() const {
    return Pos >= Len || Buf[Pos] == '\n' || Buf[Pos] == '\r';
  }
  bool atEnd() const { return Pos >= Len; }
  /// Consumes the line end at Pos (\n, \r\n or \r); nothing at the end of the text.
  void consumeLineEnd();
  /// Scans the token at Pos, which is neither blank nor a line end. A
  /// multi-line token moves Line and LineStart past its inner line ends.
  void scan(Token &T);
  /// Type of the token at Pos and its end, without moving.
  TokenKind peek(size_t *End) const;

  const char *Buf;
  size_t Len;
  size_t Pos;
  size_t Line = 0;
  size_t LineStart;
};

/// Indentation column of the white space at Buf[Pos..): tabs advance to the
/// next multiple of 8, a form feed resets to 0. *After receives the offset
/// of the first other byte.
long indentColumn(const char *Buf, size_t Len, size_t Pos, size_t *After);

// The lexer's per-token steps are inline: they run once per token.

inline void Lexer::skipBlanks() {
  while (Pos < Len && detail::isBlank(Buf[Pos]))
    ++Pos;
}

inline void Lexer::consumeLineEnd() {
  if (Pos >= Len)
    return;
  if (Buf[Pos] == '\r' && Pos + 1 < Len && Buf[Pos + 1] == '\n')
    Pos += 2;
  else
    Pos += 1;
  ++Line;
  LineStart = Pos;
}

inline TokenKind Lexer::peek(size_t *End) const {
  size_t P = Pos;
  unsigned char C = Buf[P];
  if (detail::isNameStart(C)) {
    size_t Q = P + 1;
    while (Q < Len && detail::isNameChar(Buf[Q]))
      ++Q;
    if (Q < Len && (Buf[Q] == '\'' || Buf[Q] == '"') && isStringPrefix(Buf + P, Q - P)) {
      *End = findStringEnd(Buf, Len, Q);
      return TokenKind::STRING;
    }
    *End = Q;
    return TokenKind::NAME;
  }
  if (detail::isDigit(C) || (C == '.' && P + 1 < Len && detail::isDigit(Buf[P + 1]))) {
    *End = scanNumber(Buf, Len, P);
    return TokenKind::NUMBER;
  }
  if (C == '\'' || C == '"') {
    *End = findStringEnd(Buf, Len, P);
    return TokenKind::STRING;
  }
  if (C == '#') {
    size_t Q = P + 1;
    while (Q < Len && !detail::isLineEnd(Buf[Q]))
      ++Q;
    *End = Q;
    return TokenKind::COMMENT;
  }
  if (C == '\\') {
    *End = P + 1;
    // Only a backslash at the end of a line continues it.
    return P + 1 >= Len || detail::isLineEnd(Buf[P + 1]) ? TokenKind::CONTINUATION
                                                 : TokenKind::ERRORTOKEN;
  }
  TokenKind K;
  size_t N = matchOperator(Buf + P, Len - P, &K);
  if (N) {
    *End = P + N;
    return K;
  }
  *End = P + 1;
  return TokenKind::ERRORTOKEN;
}

inline void Lexer::scan(Token &T) {
  size_t End;
  T.Type = peek(&End);
  T.Start = Pos;
  T.End = End;
  T.Line = Line;
  T.Col = Pos - LineStart;
  if (T.Type == TokenKind::STRING) {
    // Count the line ends inside a multi-line literal.
    for (size_t P = Pos; P < End; ++P) {
      char C = Buf[P];
      if (C == '\n' || (C == '\r' && (P + 1 >= Len || Buf[P + 1] != '\n'))) {
        ++Line;
        LineStart = P + 1;
      }
    }
  }
  Pos = End;
}

} // namespace tokcore

#endif
