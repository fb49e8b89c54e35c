// JoinTokens: token texts joined into source text with conventional spacing.
//
// Every input text is lexed again with a small lexer of its own (not the
// module's tokenizer): "..." is three "." tokens, an unterminated string ends
// at a newline or at the end of the text, so a text lexes the same whether it
// is joined at once or in pieces.
#include "pysource/_fastaccess/jointokens.h"

#include <cstring>
#include <string>
#include <vector>

#include "pyref.h"

namespace fastaccess {

namespace {

// -- The lexer -----------------------------------------------------------------

constexpr size_t kNoMatch = static_cast<size_t>(-1);

bool isBlank(char C) { return C == ' ' || C == '\t' || C == '\f' || C == '\r' || C == '\n'; }
bool isDigit(char C) { return C >= '0' && C <= '9'; }
bool isAlpha(char C) { return (C >= 'a' && C <= 'z') || (C >= 'A' && C <= 'Z'); }
bool isHigh(char C) { return static_cast<unsigned char>(C) >= 0x80; }
bool isIdStart(char C) { return isAlpha(C) || C == '_' || isHigh(C); }
bool isIdChar(char C) { return isIdStart(C) || isDigit(C); }
bool isQuote(char C) { return C == '\'' || C == '"'; }
bool isDigitOrUnderscore(char C) { return isDigit(C) || C == '_'; }
bool isHexOrUnderscore(char C) {
  return isDigitOrUnderscore(C) || (C >= 'a' && C <= 'f') || (C >= 'A' && C <= 'F');
}
bool isOneOf(char C, const char *Set) { return C != '\0' && strchr(Set, C) != nullptr; }
bool isPrefixLetter(char C) {
  switch (C) {
  case 'u': case 'U': case 'b': case 'B': case 'r': case 'R': case 'f': case 'F':
    return true;
  default:
    return false;
  }
}

/// End of the triple-quoted string whose opening quotes are at Q, or kNoMatch
/// when a backslash ends the text. An unterminated string runs to the end.
size_t tripleStringEnd(const char *S, size_t Len, size_t Q) {
  const char C = S[Q];
  size_t P = Q + 3;
  for (;;) {
    if (P + 3 <= Len && S[P] == C && S[P + 1] == C && S[P + 2] == C)
      return P + 3;
    if (P == Len)
      return Len;
    if (S[P] == '\\') {
      if (P + 1 == Len)
        return kNoMatch;
      P += 2;
    } else {
      ++P;
    }
  }
}

/// End of the one-quote string whose quote is at Q: after the closing quote,
/// before a newline, or the end of the text; kNoMatch when a backslash ends
/// the text.
size_t singleStringEnd(const char *S, size_t Len, size_t Q) {
  const char C = S[Q];
  size_t P = Q + 1;
  for (;;) {
    if (P == Len)
      return Len;
    const char X = S[P];
    if (X == C)
      return P + 1;
    if (X == '\n')
      return P;
    if (X == '\\') {
      if (P + 1 == Len)
        return kNoMatch;
      P += 2;
    } else {
      ++P;
    }
  }
}

/// End of the string literal (prefix letters included) at P, or kNoMatch.
size_t stringEnd(const char *S, size_t Len, size_t P) {
  size_t Q;
  if (isQuote(S[P]))
    Q = P;
  else if (isPrefixLetter(S[P]) && P + 1 < Len && isQuote(S[P + 1]))
    Q = P + 1;
  else if (isPrefixLetter(S[P]) && P + 2 < Len && isPrefixLetter(S[P + 1]) && isQuote(S[P + 2]))
    Q = P + 2;
  else
    return kNoMatch;
  if (Q + 2 < Len && S[Q + 1] == S[Q] && S[Q + 2] == S[Q]) {
    size_t E = tripleStringEnd(S, Len, Q);
    if (E != kNoMatch)
      return E;
  }
  return singleStringEnd(S, Len, Q);
}

/// Skips an exponent ("e", a sign, digits) at P, if there is a whole one.
size_t skipExponent(const char *S, size_t Len, size_t P) {
  if (P < Len && (S[P] == 'e' || S[P] == 'E')) {
    size_t Q = P + 1;
    if (Q < Len && (S[Q] == '+' || S[Q] == '-'))
      ++Q;
    if (Q < Len && isDigit(S[Q])) {
      ++Q;
      while (Q < Len && isDigitOrUnderscore(S[Q]))
        ++Q;
      return Q;
    }
  }
  return P;
}

/// End of the number at P, or kNoMatch.
size_t numberEnd(const char *S, size_t Len, size_t P) {
  size_t E;
  if (S[P] == '0' && P + 2 < Len && isOneOf(S[P + 1], "xXoObB") && isHexOrUnderscore(S[P + 2])) {
    E = P + 3;
    while (E < Len && isHexOrUnderscore(S[E]))
      ++E;
    if (E < Len && (S[E] == 'l' || S[E] == 'L'))
      ++E;
    return E;
  }
  if (isDigit(S[P])) {
    E = P + 1;
    while (E < Len && isDigitOrUnderscore(S[E]))
      ++E;
    if (E < Len && S[E] == '.')
      ++E;
    while (E < Len && isDigitOrUnderscore(S[E]))
      ++E;
  } else if (S[P] == '.' && P + 1 < Len && isDigit(S[P + 1])) {
    E = P + 2;
    while (E < Len && isDigitOrUnderscore(S[E]))
      ++E;
  } else {
    return kNoMatch;
  }
  E = skipExponent(S, Len, E);
  if (E < Len && isOneOf(S[E], "lLjJ"))
    ++E;
  return E;
}

// Operators of more than one character; "..." is three "." tokens.
const char *const kOperators3[] = {"**=", "//=", ">>=", "<<="};
const char *const kOperators2[] = {"->", "**", "//", "<<", ">>", "<=", ">=", "==", "!=", "<>",
                                   "+=", "-=", "*=", "/=", "%=", "&=", "|=", "^=", "@=", ":="};

/// End of the token that starts at P (a non-blank byte before Len).
size_t tokenEnd(const char *S, size_t Len, size_t P) {
  size_t E = stringEnd(S, Len, P);
  if (E != kNoMatch)
    return E;
  if (isIdStart(S[P])) {
    E = P + 1;
    while (E < Len && isIdChar(S[E]))
      ++E;
    return E;
  }
  E = numberEnd(S, Len, P);
  if (E != kNoMatch)
    return E;
  if (S[P] == '#') {
    E = P + 1;
    while (E < Len && S[E] != '\r' && S[E] != '\n')
      ++E;
    return E;
  }
  if (P + 3 <= Len)
    for (const char *Op : kOperators3)
      if (S[P] == Op[0] && S[P + 1] == Op[1] && S[P + 2] == Op[2])
        return P + 3;
  if (P + 2 <= Len)
    for (const char *Op : kOperators2)
      if (S[P] == Op[0] && S[P + 1] == Op[1])
        return P + 2;
  if (S[P] == '\\') {
    if (P + 1 < Len && S[P + 1] == '\n')
      return P + 2;
    if (P + 2 < Len && S[P + 1] == '\r' && S[P + 2] == '\n')
      return P + 3;
  }
  return P + 1;
}

struct Token {
  const char *Text;
  size_t Len;
  template <size_t N> bool is(const char (&Lit)[N]) const {
    return Len == N - 1 && memcmp(Text, Lit, N - 1) == 0;
  }
  bool is(char C) const { return Len == 1 && Text[0] == C; }
};

/// Appends the tokens of S to Out; blanks are dropped.
void lex(const char *S, size_t Len, std::vector<Token> &Out) {
  size_t P = 0;
  for (;;) {
    while (P < Len && isBlank(S[P]))
      ++P;
    if (P == Len)
      return;
    size_t E = tokenEnd(S, Len, P);
    Out.push_back(Token{S + P, E - P});
    P = E;
  }
}

// -- Spacing -------------------------------------------------------------------

enum Class { Operand, Keyword, Open, Close, Comma, Colon, Dot, Op, NoClass };

struct Word {
  const char *Text;
  size_t Len;
};

#define TL_WORD(W) Word{W, sizeof(W) - 1}
const Word kKeywords[] = {
    TL_WORD("and"),    TL_WORD("as"),     TL_WORD("assert"), TL_WORD("async"),
    TL_WORD("await"),  TL_WORD("break"),  TL_WORD("class"),  TL_WORD("continue"),
    TL_WORD("def"),    TL_WORD("del"),    TL_WORD("elif"),   TL_WORD("else"),
    TL_WORD("except"), TL_WORD("finally"), TL_WORD("for"),   TL_WORD("from"),
    TL_WORD("global"), TL_WORD("if"),     TL_WORD("import"), TL_WORD("in"),
    TL_WORD("is"),     TL_WORD("lambda"), TL_WORD("nonlocal"), TL_WORD("not"),
    TL_WORD("or"),     TL_WORD("pass"),   TL_WORD("raise"),  TL_WORD("return"),
    TL_WORD("try"),    TL_WORD("while"),  TL_WORD("with"),   TL_WORD("yield")};
#undef TL_WORD

bool isKeyword(const Token &T) {
  if (T.Len < 2 || T.Len > 8 || T.Text[0] < 'a' || T.Text[0] > 'y')
    return false;
  for (const Word &K : kKeywords)
    if (K.Len == T.Len && K.Text[0] == T.Text[0] && memcmp(K.Text, T.Text, T.Len) == 0)
      return true;
  return false;
}

Class classOf(const Token &T) {
  const char C = T.Text[0];
  if (isIdStart(C))
    return isKeyword(T) ? Keyword : Operand;
  if (isDigit(C) || isQuote(C) || (C == '.' && T.Len > 1))
    return Operand;
  if (C == '(' || C == '[' || C == '{')
    return Open;
  if (C == ')' || C == ']' || C == '}')
    return Close;
  if (T.is(',') || T.is(';'))
    return Comma;
  if (T.is(':'))
    return Colon;
  if (T.is('.'))
    return Dot;
  return Op;
}

bool isOpChar(char C) { return isOneOf(C, "=<>!*/%&|^+-.~@:"); }

bool maybeUnary(const Token &T) {
  return T.is('-') || T.is('+') || T.is('~') || T.is('*') || T.is("**") || T.is('@');
}

/// True when Left + Right does not lex as the two tokens.
bool wouldMerge(const Token &Left, const Token &Right, std::string &Scratch) {
  const char L0 = Left.Text[0], LN = Left.Text[Left.Len - 1], R0 = Right.Text[0];
  if (!((isOpChar(LN) && isOpChar(R0)) || (isDigit(L0) && R0 == '.') ||
        (LN == '.' && isDigit(R0))))
    return false;
  Scratch.assign(Left.Text, Left.Len);
  Scratch.append(Right.Text, Right.Len);
  const char *S = Scratch.data();
  const size_t Len = Scratch.size();
  return tokenEnd(S, Len, 0) != Left.Len || tokenEnd(S, Len, Left.Len) != Len;
}

/// An open bracket and the lambdas pending inside it.
struct Level {
  char Bracket;
  int Lambdas;
};

char openFor(char Close) { return Close == ')' ? '(' : Close == ']' ? '[' : Close == '}' ? '{' : 0; }

std::string join(const std::vector<Token> &Toks) {
  std::string Out;
  size_t Size = 0;
  for (const Token &Tok : Toks)
    Size += Tok.Len + 1;
  Out.reserve(Size);
  std::string Scratch;
  std::vector<Level> Stack{Level{0, 0}};
  const Token *Prev = nullptr;
  Class PrevCls = NoClass;
  bool PrevUnary = false; // Prev is a unary operator
  bool PrevTight = false; // Prev is a ":" or "=" written without blanks
  int Dots = 0;           // length of the run of "." ending at Prev
  for (const Token &Tok : Toks) {
    Class Cls = classOf(Tok);
    if (Tok.is('`'))
      Cls = Stack.back().Bracket == '`' ? Close : Open;
    const bool PrevOperand = PrevCls == Operand || PrevCls == Close || (PrevCls == Dot && Dots >= 3);
    const bool Unary = Cls == Op && maybeUnary(Tok) && !PrevOperand;
    bool Tight = false;
    if (Tok.is(':')) {
      Level &Top = Stack.back();
      if (Top.Lambdas)
        --Top.Lambdas;
      else if (Top.Bracket == '[')
        Tight = true;
    } else if (Tok.is('=') && (Stack.back().Bracket == '(' || Stack.back().Lambdas)) {
      Tight = true;
    }
    bool Space;
    if (!Prev || Cls == Close || PrevCls == Open)
      Space = false;
    else if (Cls == Comma || Cls == Colon)
      Space = false;
    else if (PrevCls == Comma)
      Space = true;
    else if (PrevCls == Colon)
      Space = !PrevTight;
    else if (PrevUnary)
      Space = false;
    else if (PrevCls == Op)
      Space = !PrevTight;
    else if (Tight)
      Space = false;
    else if (Cls == Dot)
      Space = PrevCls == Keyword;
    else if (PrevCls == Dot)
      Space = Cls == Keyword || (Dots >= 3 && Cls != Open);
    else if (Cls == Open && (Tok.is('(') || Tok.is('[')))
      Space = !PrevOperand;
    else
      Space = true;
    if (!Space && Prev && wouldMerge(*Prev, Tok, Scratch))
      Space = true;
    if (Space)
      Out += ' ';
    Out.append(Tok.Text, Tok.Len);
    if (Cls == Open) {
      Stack.push_back(Level{Tok.Text[0], 0});
    } else if (Cls == Close && Stack.size() > 1) {
      const char Want = Tok.is('`') ? '`' : openFor(Tok.Text[0]);
      if (Stack.back().Bracket == Want)
        Stack.pop_back();
    } else if (Tok.is("lambda")) {
      ++Stack.back().Lambdas;
    }
    Dots = Cls == Dot ? Dots + 1 : 0;
    Prev = &Tok;
    PrevCls = Cls;
    PrevUnary = Unary;
    PrevTight = Tight;
  }
  return Out;
}

// -- Binding -------------------------------------------------------------------

/// type(O).__name__: the full name of a heap type, the part after the last
/// "." of a static type's name.
const char *shortTypeName(PyObject *O) {
  PyTypeObject *T = Py_TYPE(O);
  const char *Name = T->tp_name;
  if (!(T->tp_flags & Py_TPFLAGS_HEAPTYPE)) {
    const char *Dot = strrchr(Name, '.');
    if (Dot)
      Name = Dot + 1;
  }
  return Name;
}

/// Lexes one text: bytes as they are, unicode encoded as UTF-8. Held keeps
/// the bytes the tokens point into alive unless Item is kept alive elsewhere
/// (Borrowed).
void lexItem(PyObject *Item, bool Borrowed, std::vector<Token> &Toks, std::vector<tl::Ref> &Held) {
  PyObject *Bytes = Item;
  if (PyString_Check(Item)) {
    if (!Borrowed)
      Held.push_back(tl::Ref::borrow(Item));
  } else if (PyUnicode_Check(Item)) {
    Held.push_back(tl::require(PyUnicode_AsUTF8String(Item)));
    Bytes = Held.back().get();
  } else {
    tl::raiseFormat(PyExc_TypeError, "Expected %.16s, got %.200s", "bytes", shortTypeName(Item));
  }
  lex(PyString_AS_STRING(Bytes), static_cast<size_t>(PyString_GET_SIZE(Bytes)), Toks);
}

/// The one argument, texts, given by position or by keyword; the errors are
/// those of a Python function JoinTokens(texts).
PyObject *textsArg(PyObject *Args, PyObject *Kw) {
  const Py_ssize_t NArgs = PyTuple_GET_SIZE(Args);
  const Py_ssize_t NKw = Kw ? PyDict_Size(Kw) : 0;
  if (NArgs > 1)
    tl::raiseFormat(PyExc_TypeError, "JoinTokens() takes exactly 1 argument (%zd given)",
                    NArgs + NKw);
  PyObject *Texts = NArgs ? PyTuple_GET_ITEM(Args, 0) : nullptr;
  Py_ssize_t Pos = 0;
  PyObject *Key, *Value;
  while (Kw && PyDict_Next(Kw, &Pos, &Key, &Value)) {
    if (!PyString_Check(Key))
      tl::raise(PyExc_TypeError, "JoinTokens() keywords must be strings");
    if (strcmp(PyString_AS_STRING(Key), "texts") != 0)
      tl::raiseFormat(PyExc_TypeError, "JoinTokens() got an unexpected keyword argument '%.400s'",
                      PyString_AS_STRING(Key));
    if (Texts)
      tl::raise(PyExc_TypeError, "JoinTokens() got multiple values for keyword argument 'texts'");
    Texts = Value;
  }
  if (!Texts)
    tl::raise(PyExc_TypeError, "JoinTokens() takes exactly 1 argument (0 given)");
  return Texts;
}

} // namespace

PyObject *f_join_tokens(PyObject *, PyObject *Args, PyObject *Kw) {
  return tl::guard<PyObject *>(nullptr, [&]() -> PyObject * {
    PyObject *Texts = textsArg(Args, Kw);
    std::vector<tl::Ref> Held;
    std::vector<Token> Toks;
    Toks.reserve(32);
    if (PyList_CheckExact(Texts) || PyTuple_CheckExact(Texts)) {
      // No Python code runs while lexing, so the sequence keeps its items.
      const Py_ssize_t N = PySequence_Fast_GET_SIZE(Texts);
      PyObject **Items = PySequence_Fast_ITEMS(Texts);
      for (Py_ssize_t I = 0; I < N; ++I)
        lexItem(Items[I], true, Toks, Held);
    } else {
      tl::Ref Iter = tl::require(PyObject_GetIter(Texts));
      while (PyObject *Item = PyIter_Next(Iter.get())) {
        tl::Ref Owned = tl::Ref::steal(Item);
        lexItem(Item, false, Toks, Held);
      }
      if (PyErr_Occurred())
        throw tl::PyErrSet();
    }
    const std::string Out = join(Toks);
    return PyString_FromStringAndSize(Out.data(), static_cast<Py_ssize_t>(Out.size()));
  });
}

} // namespace fastaccess
