// Token scanning and classification for Python 2.7 and 3.x source bytes.
#include "tokenize/tokenizer.h"

namespace tokcore {

using namespace detail;

// NUMBER: 0[xX][0-9a-fA-F_]* [lL]? | 0[oObB][0-9_]* [lL]?
//       | (D ('.' D?)? | '.' D) ([eE] [+-]? D)? [jJlL]?     with D = [0-9] ('_'? [0-9])*
size_t scanNumber(const char *Buf, size_t Len, size_t P) {
  auto At = [&](size_t I) -> unsigned char { return I < Len ? Buf[I] : 0; };
  // An underscore counts only between digits: `1_000`, but `1.__class__`.
  auto Digits = [&](size_t I) {
    while (isDigit(At(I)) || (At(I) == '_' && isDigit(At(I + 1))))
      ++I;
    return I;
  };
  if (At(P) == '0') {
    unsigned char X = At(P + 1);
    if (X == 'x' || X == 'X' || X == 'o' || X == 'O' || X == 'b' || X == 'B') {
      bool Hex = X == 'x' || X == 'X';
      P += 2;
      while (Hex ? isHexDigit(At(P)) || At(P) == '_' : isDigit(At(P)) || At(P) == '_')
        ++P;
      if (At(P) == 'l' || At(P) == 'L')
        ++P;
      return P;
    }
  }
  P = Digits(P);
  if (At(P) == '.')
    P = Digits(P + 1);
  unsigned char E = At(P);
  if (E == 'e' || E == 'E') {
    size_t Q = P + 1;
    if (At(Q) == '+' || At(Q) == '-')
      ++Q;
    if (isDigit(At(Q))) {
      P = Digits(Q);
    }
  }
  unsigned char S = At(P);
  if (S == 'j' || S == 'J' || S == 'l' || S == 'L')
    ++P;
  return P;
}

bool isStringPrefix(const char *Text, size_t Len) {
  auto Lower = [](char C) { return static_cast<char>(C | 0x20); };
  if (Len == 1) {
    char A = Lower(Text[0]);
    return A == 'b' || A == 'r' || A == 'u' || A == 'f';
  }
  if (Len == 2) {
    char A = Lower(Text[0]), B = Lower(Text[1]);
    if (!((Text[0] >= 'A' && Text[0] <= 'Z') || (Text[0] >= 'a' && Text[0] <= 'z')) ||
        !((Text[1] >= 'A' && Text[1] <= 'Z') || (Text[1] >= 'a' && Text[1] <= 'z')))
      return false;
    return (A == 'b' && B == 'r') || (A == 'r' && B == 'b') || (A == 'f' && B == 'r') ||
           (A == 'r' && B == 'f') || (A == 'u' && B == 'r');
  }
  return false;
}

size_t matchOperator(const char *Text, size_t Len, TokenKind *Kind) {
  if (Len == 0)
    return 0;
  char C0 = Text[0];
  char C1 = Len > 1 ? Text[1] : 0;
  char C2 = Len > 2 ? Text[2] : 0;
  auto Set = [Kind](TokenKind K, size_t N) {
    *Kind = K;
    return N;
  };
  switch (C0) {
  case '(': return Set(TokenKind::LPAR, 1);
  case ')': return Set(TokenKind::RPAR, 1);
  case '[': return Set(TokenKind::LSQB, 1);
  case ']': return Set(TokenKind::RSQB, 1);
  case '{': return Set(TokenKind::LBRACE, 1);
  case '}': return Set(TokenKind::RBRACE, 1);
  case ':': return C1 == '=' ? Set(TokenKind::COLONEQUAL, 2) : Set(TokenKind::COLON, 1);
  case ',': return Set(TokenKind::COMMA, 1);
  case ';': return Set(TokenKind::SEMI, 1);
  case '~': return Set(TokenKind::TILDE, 1);
  case '`': return Set(TokenKind::BACKQUOTE, 1);
  case '+': return C1 == '=' ? Set(TokenKind::PLUSEQUAL, 2) : Set(TokenKind::PLUS, 1);
  case '-':
    if (C1 == '=')
      return Set(TokenKind::MINEQUAL, 2);
    if (C1 == '>')
      return Set(TokenKind::RARROW, 2);
    return Set(TokenKind::MINUS, 1);
  case '*':
    if (C1 == '*')
      return C2 == '=' ? Set(TokenKind::DOUBLESTAREQUAL, 3) : Set(TokenKind::DOUBLESTAR, 2);
    return C1 == '=' ? Set(TokenKind::STAREQUAL, 2) : Set(TokenKind::STAR, 1);
  case '/':
    if (C1 == '/')
      return C2 == '=' ? Set(TokenKind::DOUBLESLASHEQUAL, 3) : Set(TokenKind::DOUBLESLASH, 2);
    return C1 == '=' ? Set(TokenKind::SLASHEQUAL, 2) : Set(TokenKind::SLASH, 1);
  case '%': return C1 == '=' ? Set(TokenKind::PERCENTEQUAL, 2) : Set(TokenKind::PERCENT, 1);
  case '&': return C1 == '=' ? Set(TokenKind::AMPEREQUAL, 2) : Set(TokenKind::AMPER, 1);
  case '|': return C1 == '=' ? Set(TokenKind::VBAREQUAL, 2) : Set(TokenKind::VBAR, 1);
  case '^':
    return C1 == '=' ? Set(TokenKind::CIRCUMFLEXEQUAL, 2) : Set(TokenKind::CIRCUMFLEX, 1);
  case '=': return C1 == '=' ? Set(TokenKind::EQEQUAL, 2) : Set(TokenKind::EQUAL, 1);
  case '@': return C1 == '=' ? Set(TokenKind::ATEQUAL, 2) : Set(TokenKind::AT, 1);
  case '!': return C1 == '=' ? Set(TokenKind::NOTEQUAL, 2) : 0;
  case '<':
    if (C1 == '<')
      return C2 == '=' ? Set(TokenKind::LEFTSHIFTEQUAL, 3) : Set(TokenKind::LEFTSHIFT, 2);
    if (C1 == '=')
      return Set(TokenKind::LESSEQUAL, 2);
    if (C1 == '>')
      return Set(TokenKind::NOTEQUAL, 2);
    return Set(TokenKind::LESS, 1);
  case '>':
    if (C1 == '>')
      return C2 == '=' ? Set(TokenKind::RIGHTSHIFTEQUAL, 3) : Set(TokenKind::RIGHTSHIFT, 2);
    return C1 == '=' ? Set(TokenKind::GREATEREQUAL, 2) : Set(TokenKind::GREATER, 1);
  case '.':
    if (C1 == '.' && C2 == '.')
      return Set(TokenKind::ELLIPSIS, 3);
    return Set(TokenKind::DOT, 1);
  default: return 0;
  }
}

size_t findStringEnd(const char *Buf, size_t Len, size_t QuotePos) {
  char Q = Buf[QuotePos];
  size_t P = QuotePos + 1;
  if (P + 1 < Len && Buf[P] == Q && Buf[P + 1] == Q) {
    // Triple-quoted: up to the next unescaped run of three quotes.
    P += 2;
    while (P < Len) {
      char C = Buf[P];
      if (C == '\\') {
        P += 2;
      } else if (C == Q && P + 2 < Len && Buf[P + 1] == Q && Buf[P + 2] == Q) {
        return P + 3;
      } else {
        ++P;
      }
    }
    return Len;
  }
  while (P < Len) {
    char C = Buf[P];
    if (C == '\\') {
      // An escaped line end continues the literal on the next line.
      if (P + 2 < Len && Buf[P + 1] == '\r' && Buf[P + 2] == '\n')
        P += 3;
      else
        P += 2;
    } else if (C == Q) {
      return P + 1;
    } else if (C == '\n' || C == '\r') {
      return P;
    } else {
      ++P;
    }
  }
  return Len;
}

size_t bomLength(const char *Buf, size_t Len) {
  return Len >= 3 && static_cast<unsigned char>(Buf[0]) == 0xEF &&
                 static_cast<unsigned char>(Buf[1]) == 0xBB &&
                 static_cast<unsigned char>(Buf[2]) == 0xBF
             ? 3
             : 0;
}

TokenKind classifyText(const char *Text, size_t Len) {
  if (Len == 0)
    return TokenKind::ENDMARKER;
  unsigned char C = Text[0];
  if (isLineEnd(C))
    return TokenKind::NEWLINE;
  if (isNameStart(C)) {
    size_t N = 1;
    while (N < Len && N < 3 && isNameChar(Text[N]))
      ++N;
    if (N < Len && (Text[N] == '\'' || Text[N] == '"') && isStringPrefix(Text, N))
      return TokenKind::STRING;
    return TokenKind::NAME;
  }
  if (isDigit(C) || (C == '.' && Len > 1 && isDigit(Text[1])))
    return TokenKind::NUMBER;
  if (C == '\'' || C == '"')
    return TokenKind::STRING;
  if (C == '#')
    return TokenKind::COMMENT;
  if (C == '\\')
    return TokenKind::CONTINUATION;
  TokenKind K;
  if (matchOperator(Text, Len, &K))
    return K;
  return TokenKind::ERRORTOKEN;
}

long indentColumn(const char *Buf, size_t Len, size_t Pos, size_t *After) {
  long Col = 0;
  while (Pos < Len) {
    char C = Buf[Pos];
    if (C == ' ')
      ++Col;
    else if (C == '\t')
      Col = (Col / 8 + 1) * 8;
    else if (C == '\f')
      Col = 0;
    else
      break;
    ++Pos;
  }
  *After = Pos;
  return Col;
}

} // namespace tokcore
