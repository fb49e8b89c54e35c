// CFStringSupport: cuts f-string tokens into literal, expression, conversion and format parts, and
// turns the expressions of a logical line's f-strings into logical-line records of their own.
//
// The parts are cut natively from the token's bytes; Python fragment and part
// lists are built only for a Python caller or a Python subclass that overrides
// one of the list operations, whose result then replaces the native one.
#include "pysource/treelens/fstrings/fstrings.h"

#include "fieldpickle.h"
#include "override.h"
#include "pysource/treelens/host/host.h"
#include "pysource/treelens/nodes/utils.h"
#include "typedesc.h"

#include <cstring>
#include <string>

namespace treelens {
namespace fstrings {

using host::Host;
using tl::Ref;

namespace {

enum PartKind : int { kExpressionPart = 1, kStringPart = 2, kFormatPart = 3, kConversionPart = 4 };

constexpr int kStringToken = 3;

/// CFStringSupport: no state besides the four part kinds, read-only.
struct FStringSupportObject {
  PyObject_HEAD
  int ExpressionPart, StringPart, FormatPart, ConversionPart;
};

PyTypeObject FStringSupportType;

/// Interned names of the operations a Python subclass may override.
struct {
  PyObject *GetFragmentList, *RawPartList, *FStringTokenList, *GetExpressionsInLogical, *GetExpressionPartList,
      *GetPartList;
} Names;

/// Bytes owned elsewhere: by the token being cut or by an object the caller holds.
struct Span {
  const char *Data;
  Py_ssize_t Size;
  bool is(char C) const { return Size == 1 && Data[0] == C; }
  bool equals(Span O) const { return Size == O.Size && std::memcmp(Data, O.Data, Size) == 0; }
};

/// (offset, text); Offset counts from the start of the string's contents.
struct Fragment {
  Py_ssize_t Offset;
  Span Text;
};

/// Fragments with the objects that own texts an override supplied.
struct Fragments {
  std::vector<Fragment> Items;
  std::vector<Ref> Owners;
};

/// (kind, text, start); Start counts from the start of the token.
struct RawPart {
  int Kind;
  std::string Text;
  Py_ssize_t Start;
};

/// (tok_str, (row, col)) of one f-string token of a logical.
struct TokenEntry {
  Ref Text;
  Py_ssize_t Row, Col;
};

/// Keeps nested f-strings from recursing without bound.
struct RecursionGuard {
  explicit RecursionGuard(const char *Where) {
    if (Py_EnterRecursiveCall(const_cast<char *>(Where)))
      throw tl::PyErrSet();
  }
  ~RecursionGuard() { Py_LeaveRecursiveCall(); }
  RecursionGuard(const RecursionGuard &) = delete;
};

Ref bytesOf(const char *S, Py_ssize_t N) { return tl::require(PyString_FromStringAndSize(S, N)); }

Py_ssize_t toSsize(PyObject *O) {
  Py_ssize_t V = PyNumber_AsSsize_t(O, PyExc_OverflowError);
  if (V == -1 && PyErr_Occurred())
    throw tl::PyErrSet();
  return V;
}

/// Unpacks Seq into exactly N references, with the messages of tuple unpacking.
void unpack(PyObject *Seq, Py_ssize_t N, Ref *Out) {
  Py_ssize_t Got = 0;
  if (PyTuple_CheckExact(Seq) || PyList_CheckExact(Seq)) {
    Got = PySequence_Fast_GET_SIZE(Seq);
    if (Got == N) {
      for (Py_ssize_t I = 0; I < N; ++I)
        Out[I] = Ref::borrow(PySequence_Fast_GET_ITEM(Seq, I));
      return;
    }
  } else {
    Ref It = tl::require(PyObject_GetIter(Seq));
    while (PyObject *Item = PyIter_Next(It.get())) {
      if (Got == N) {
        Py_DECREF(Item);
        Got = N + 1;
        break;
      }
      Out[Got++] = Ref::steal(Item);
    }
    if (PyErr_Occurred())
      throw tl::PyErrSet();
    if (Got == N)
      return;
  }
  if (Got < N)
    tl::raiseFormat(PyExc_ValueError, "need more than %zd value%.1s to unpack", Got, Got == 1 ? "" : "s");
  tl::raiseFormat(PyExc_ValueError, "too many values to unpack (expected %zd)", N);
}

/// R, after checking that an override returned a list.
Ref requireList(Ref R) {
  tl::expectType(PyList_Check(R.get()), "list", R.get());
  return R;
}

/// Length of the first Rows lines of Text, line ends included (\n, \r\n or \r).
Py_ssize_t firstLinesLength(PyObject *Text, Py_ssize_t Rows) {
  tl::expectType(PyString_Check(Text), "bytes", Text);
  const char *S = PyString_AS_STRING(Text);
  Py_ssize_t N = PyString_GET_SIZE(Text), I = 0;
  for (; I < N && Rows > 0; ++I) {
    if (S[I] == '\n' || (S[I] == '\r' && (I + 1 == N || S[I + 1] != '\n')))
      --Rows;
  }
  return I;
}

// ---- Recognition ----

/// The prefix letters before the opening quote are f, fr or rf, in any case.
bool hasFPrefix(const char *S, Py_ssize_t N) {
  bool SawF = false, SawR = false;
  Py_ssize_t I = 0;
  for (; I < N && I < 2; ++I) {
    char C = S[I];
    if ((C == 'f' || C == 'F') && !SawF)
      SawF = true;
    else if ((C == 'r' || C == 'R') && !SawR)
      SawR = true;
    else
      break;
  }
  return SawF && I < N && (S[I] == '\'' || S[I] == '"');
}

// ---- Fragments ----

/// The delimiters: quotes, brackets, and the "!", "=" and ":" that end an expression.
bool isDelimiter(char C) {
  switch (C) {
  case '\'':
  case '"':
  case '{':
  case '}':
  case '[':
  case ']':
  case '(':
  case ')':
  case '!':
  case '=':
  case ':': return true;
  default: return false;
  }
}

/// Cuts S at every delimiter: the text between delimiters is one fragment,
/// each delimiter another; "!=" is one fragment, and three adjacent equal
/// quotes (after at least one earlier fragment) are one triple-quote fragment.
void cutFragments(const char *S, Py_ssize_t N, std::vector<Fragment> &Out) {
  Py_ssize_t Pos = 0;
  char Prev = 0;
  for (Py_ssize_t I = 0; I < N; ++I) {
    char C = S[I];
    if (!isDelimiter(C))
      continue;
    if (I > Pos)
      Out.push_back({Pos, {S + Pos, I - Pos}});
    if (Prev == '!' && C == '=' && I == Pos) {
      Out.back().Text.Size = 2;
    } else if (C == Prev && (C == '\'' || C == '"') && I == Pos && Out.size() > 2 &&
               Out[Out.size() - 2].Text.is(C)) {
      Out[Out.size() - 2].Text.Size = 3;
      Out.pop_back();
    } else {
      Out.push_back({I, {S + I, 1}});
    }
    Pos = I + 1;
    Prev = C;
  }
  if (N > Pos)
    Out.push_back({Pos, {S + Pos, N - Pos}});
}

/// _GetFragmentList of the contents S, a Python override honoured.
void fragmentList(PyObject *Self, const char *S, Py_ssize_t N, Fragments &Out) {
  if (!tl::pythonOverride(Self, Names.GetFragmentList)) {
    cutFragments(S, N, Out.Items);
    return;
  }
  Ref List = requireList(tl::callMethod(Self, Names.GetFragmentList, bytesOf(S, N).get()));
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(List.get()); ++I) {
    Ref Item = Ref::borrow(PyList_GET_ITEM(List.get(), I));
    Ref Pair[2];
    unpack(Item.get(), 2, Pair);
    Py_ssize_t Offset = toSsize(Pair[0].get());
    tl::expectType(PyString_Check(Pair[1].get()), "bytes", Pair[1].get());
    Out.Items.push_back({Offset, {PyString_AS_STRING(Pair[1].get()), PyString_GET_SIZE(Pair[1].get())}});
    Out.Owners.push_back(std::move(Pair[1]));
  }
}

// ---- Raw parts ----

/// A fragment of one to three equal quote characters that opens or closes a string.
bool isQuote(Span S) {
  if ((S.Size != 1 && S.Size != 3) || (S.Data[0] != '\'' && S.Data[0] != '"'))
    return false;
  return S.Size == 1 || (S.Data[1] == S.Data[0] && S.Data[2] == S.Data[0]);
}

/// The string open after quote fragment Q inside an expression: only the
/// quote that opened a string closes it; other quotes are its text. A triple
/// of the open single quote closes it and an adjacent empty string.
Span afterQuote(Span Open, Span Q) {
  if (!Open.Data)
    return Q;
  if (Open.equals(Q) || (Open.Size == 1 && Q.Size == 3 && Q.Data[0] == Open.Data[0]))
    return {nullptr, 0};
  return Open;
}

/// Net bracket depth change of a fragment.
int bracketBalance(Span S) {
  int D = 0;
  for (Py_ssize_t I = 0; I < S.Size; ++I) {
    switch (S.Data[I]) {
    case '(':
    case '[':
    case '{': ++D; break;
    case ')':
    case ']':
    case '}': --D; break;
    default: break;
    }
  }
  return D;
}

/// Text that ends in the "\N" of a named character escape: an N after an odd
/// number of backslashes.
bool endsWithNamedEscape(Span S) {
  if (S.Size < 2 || S.Data[S.Size - 1] != 'N')
    return false;
  Py_ssize_t Backslashes = 0;
  for (Py_ssize_t I = S.Size - 2; I >= 0 && S.Data[I] == '\\'; --I)
    ++Backslashes;
  return Backslashes % 2 == 1;
}

/// The raw parts of the token Tok (N bytes). Each delimiter that changes the
/// kind belongs to no part; a part starts at the byte after it.
void cutParts(PyObject *Self, const char *Tok, Py_ssize_t N, bool ExpOnly, std::vector<RawPart> &Out) {
  QuoteSplit Q = splitPyQuotes(Tok, static_cast<std::size_t>(N));
  if (Q.PrefixLen == 0)
    return;
  Py_ssize_t Prefix = static_cast<Py_ssize_t>(Q.PrefixLen);
  Fragments F;
  fragmentList(Self, Tok + Prefix, N - Prefix - static_cast<Py_ssize_t>(Q.SuffixLen), F);
  const std::vector<Fragment> &Items = F.Items;

  int Kind = kStringPart;
  std::string Cur;
  Py_ssize_t Start = Prefix;
  int Depth = 0;
  Span Open = {nullptr, 0}; // the quote of the string open inside an expression
  bool InFormat = false, Skip = false, InNamedEscape = false;
  bool Raw = std::memchr(Tok, 'r', Prefix) || std::memchr(Tok, 'R', Prefix);
  for (std::size_t I = 0; I < Items.size(); ++I) {
    Span Frag = Items[I].Text;
    if (Skip) {
      Skip = false;
      Cur.append(Frag.Data, Frag.Size);
      continue;
    }
    int PrevKind = Kind;
    bool AtTop = !Open.Data && Depth == 0;
    switch (Kind) {
    case kStringPart:
      if (InNamedEscape) {
        InNamedEscape = !Frag.is('}');
      } else if (Frag.is('{') && !Raw && I > 0 && endsWithNamedEscape(Items[I - 1].Text)) {
        InNamedEscape = true; // "\N{NAME}" names a character: its braces are text
      } else if (Frag.is('{')) {
        if (I + 1 < Items.size() && Items[I + 1].Text.is('{'))
          Skip = true; // "{{" is an escaped brace, kept doubled in the text
        else
          Kind = kExpressionPart;
      }
      break;
    case kExpressionPart:
      if (AtTop && Frag.is('}')) {
        Kind = InFormat ? kFormatPart : kStringPart;
        InFormat = false;
      } else if (AtTop && Frag.is('!')) {
        Kind = kConversionPart;
      } else if (AtTop && Frag.is(':')) {
        Kind = kFormatPart;
      } else if (isQuote(Frag)) {
        Open = afterQuote(Open, Frag);
      } else if (!Open.Data) {
        Depth += bracketBalance(Frag); // brackets inside a nested string are its text
      }
      break;
    case kConversionPart:
      if (Frag.is(':'))
        Kind = kFormatPart;
      else if (Frag.is('}'))
        Kind = kStringPart;
      break;
    case kFormatPart:
      if (InNamedEscape) {
        InNamedEscape = !Frag.is('}');
      } else if (Frag.is('{') && !Raw && I > 0 && endsWithNamedEscape(Items[I - 1].Text)) {
        InNamedEscape = true; // a format specification names characters too
      } else if (Frag.is('{')) {
        Kind = kExpressionPart; // a replacement field nested in the format specification
        InFormat = true;
      } else if (Frag.is('}')) {
        Kind = kStringPart;
      }
      break;
    }
    if (Kind != PrevKind) {
      if (!Cur.empty() && (PrevKind == kExpressionPart || !ExpOnly))
        Out.push_back({PrevKind, std::move(Cur), Start});
      Cur.clear();
      Depth = 0;
      Open = {nullptr, 0};
      Start = Prefix + Items[I].Offset + 1;
    } else {
      Cur.append(Frag.Data, Frag.Size);
    }
  }
  if (!Cur.empty() && (Kind == kExpressionPart || !ExpOnly))
    Out.push_back({Kind, std::move(Cur), Start});
}

/// _RawPartList(tok, exp_only), a Python override honoured.
void rawPartList(PyObject *Self, PyObject *Tok, bool ExpOnly, std::vector<RawPart> &Out) {
  if (tl::pythonOverride(Self, Names.RawPartList)) {
    Ref List = requireList(tl::callMethod(Self, Names.RawPartList, Tok, ExpOnly ? Py_True : Py_False));
    for (Py_ssize_t I = 0; I < PyList_GET_SIZE(List.get()); ++I) {
      Ref Item = Ref::borrow(PyList_GET_ITEM(List.get(), I));
      Ref Triple[3];
      unpack(Item.get(), 3, Triple);
      Py_ssize_t Kind = toSsize(Triple[0].get());
      tl::expectType(PyString_Check(Triple[1].get()), "bytes", Triple[1].get());
      Py_ssize_t Start = toSsize(Triple[2].get());
      Out.push_back({static_cast<int>(Kind),
                     std::string(PyString_AS_STRING(Triple[1].get()), PyString_GET_SIZE(Triple[1].get())), Start});
    }
    return;
  }
  tl::expectType(PyString_Check(Tok), "bytes", Tok);
  cutParts(Self, PyString_AS_STRING(Tok), PyString_GET_SIZE(Tok), ExpOnly, Out);
}

// ---- Part lists and expressions ----

/// Items of an override's list of (text, pos, logical) triples.
void itemsFromList(Ref List, std::vector<ExprItem> &Out) {
  List = requireList(std::move(List));
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(List.get()); ++I) {
    Ref Item = Ref::borrow(PyList_GET_ITEM(List.get(), I));
    Ref Triple[3];
    unpack(Item.get(), 3, Triple);
    Py_ssize_t Pos = toSsize(Triple[1].get());
    Out.push_back({std::move(Triple[0]), Pos, std::move(Triple[2])});
  }
}

/// (text, pos, logical) triples; None for a missing text or logical.
Ref itemsToList(std::vector<ExprItem> &Items) {
  Ref List = tl::require(PyList_New(static_cast<Py_ssize_t>(Items.size())));
  for (std::size_t I = 0; I < Items.size(); ++I) {
    ExprItem &It = Items[I];
    Ref Pos = tl::require(PyInt_FromSsize_t(It.Pos));
    PyObject *Tuple = PyTuple_Pack(3, It.Text ? It.Text.get() : Py_None, Pos.get(),
                                   It.Logical ? It.Logical.get() : Py_None);
    if (!Tuple)
      throw tl::PyErrSet();
    PyList_SET_ITEM(List.get(), static_cast<Py_ssize_t>(I), Tuple);
  }
  return List;
}

void fstringTokenList(PyObject *Self, PyObject *Logical, std::vector<TokenEntry> &Out);
void expressionsInLogical(PyObject *Self, PyObject *Logical, bool WantText, std::vector<ExprItem> &Out);
void partList(PyObject *Self, PyObject *Tok, bool ExpOnly, bool WantText, std::vector<ExprItem> &Out);

/// Tok as bytes: unicode is encoded as UTF-8.
Ref tokenBytes(PyObject *Tok) {
  if (PyUnicode_Check(Tok))
    return tl::require(PyUnicode_AsUTF8String(Tok));
  tl::expectType(PyString_Check(Tok), "bytes", Tok);
  return Ref::borrow(Tok);
}

/// One record for an expression that spans lines, or null when the text is
/// not one bracketed expression. Line ends inside a replacement field do not
/// end the expression, as inside brackets: the text is split in parentheses,
/// which are then dropped from the record.
Ref joinedLogical(const std::string &Part) {
  std::string Wrapped = "(" + Part + "\n)";
  Ref Logicals = tl::require(Host.Fast->SplitLogicals(Wrapped.data(), static_cast<Py_ssize_t>(Wrapped.size())));
  if (!PyList_Check(Logicals.get()) || PyList_GET_SIZE(Logicals.get()) != 1)
    return Ref();
  PyObject *Only = PyList_GET_ITEM(Logicals.get(), 0);
  if (!host::isLogical(Only))
    return Ref();
  auto *L = reinterpret_cast<host::LogicalLineObject *>(Only);
  Py_ssize_t N = L->TokenCount;
  auto IsText = [&](Py_ssize_t I, char C) {
    PyObject *T = L->Texts[I];
    return T && PyString_Check(T) && PyString_GET_SIZE(T) == 1 && PyString_AS_STRING(T)[0] == C;
  };
  if (N < 2 || !IsText(0, '(') || !IsText(N - 1, ')') || L->Positions[0].Col != 0)
    return Ref();
  Ref Tokens = tl::require(PyTuple_New(N - 2));
  for (Py_ssize_t I = 1; I < N - 1; ++I) {
    long Row = L->Positions[I].Row, Col = L->Positions[I].Col - (Row == 0 ? 1 : 0);
    PyObject *Entry = Py_BuildValue("(O(ll))", L->Texts[I], Row, Col);
    if (!Entry)
      throw tl::PyErrSet();
    PyTuple_SET_ITEM(Tokens.get(), I - 1, Entry);
  }
  Ref LineText = bytesOf(Part.data(), static_cast<Py_ssize_t>(Part.size()));
  return tl::require(PyObject_CallFunction(reinterpret_cast<PyObject *>(Host.LogicalLineType),
                                           const_cast<char *>("(OilO)"), Tokens.get(), 0, 0L, LineText.get()));
}

/// GetPartList's own work: each expression part is split into logical-line
/// records (one, when it is one expression over several lines), and the
/// expressions of f-strings nested in them follow each record, placed
/// relative to the token.
void partListImpl(PyObject *Self, PyObject *Tok, bool ExpOnly, bool WantText, std::vector<ExprItem> &Out) {
  RecursionGuard Guard(" while listing the parts of an f-string");
  Ref Bytes = tokenBytes(Tok);
  std::vector<RawPart> Parts;
  rawPartList(Self, Bytes.get(), ExpOnly, Parts);
  for (RawPart &P : Parts) {
    Ref Text = WantText ? bytesOf(P.Text.data(), static_cast<Py_ssize_t>(P.Text.size())) : Ref();
    if (P.Kind != kExpressionPart) {
      Out.push_back({std::move(Text), P.Start, Ref()});
      continue;
    }
    Ref Logicals = tl::require(Host.Fast->SplitLogicals(P.Text.data(), static_cast<Py_ssize_t>(P.Text.size())));
    tl::expectType(PyList_Check(Logicals.get()), "list", Logicals.get());
    if (PyList_GET_SIZE(Logicals.get()) > 1) {
      if (Ref Joined = joinedLogical(P.Text)) {
        Logicals = tl::require(PyList_New(1));
        PyList_SET_ITEM(Logicals.get(), 0, Joined.release());
      }
    }
    // Where each record starts in the part: the records' line texts tile it.
    Py_ssize_t Base = P.Text.compare(0, 3, "\xef\xbb\xbf") == 0 ? 3 : 0;
    for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Logicals.get()); ++I) {
      Ref Logical = Ref::borrow(PyList_GET_ITEM(Logicals.get(), I));
      Out.push_back({Ref::borrow(Text.get()), P.Start, Ref::borrow(Logical.get())});
      Py_ssize_t Next = Base;
      if (host::isLogical(Logical.get())) {
        PyObject *LineText = reinterpret_cast<host::LogicalLineObject *>(Logical.get())->LineText;
        if (LineText && PyString_Check(LineText))
          Next += PyString_GET_SIZE(LineText);
      }
      std::vector<ExprItem> Nested;
      expressionsInLogical(Self, Logical.get(), WantText, Nested);
      for (ExprItem &N : Nested)
        Out.push_back({std::move(N.Text), P.Start + Base + N.Pos, std::move(N.Logical)});
      Base = Next;
    }
  }
}

/// GetPartList(tok, exp_only), a Python override honoured.
void partList(PyObject *Self, PyObject *Tok, bool ExpOnly, bool WantText, std::vector<ExprItem> &Out) {
  if (tl::pythonOverride(Self, Names.GetPartList)) {
    itemsFromList(tl::callMethod(Self, Names.GetPartList, Tok, ExpOnly ? Py_True : Py_False), Out);
    return;
  }
  partListImpl(Self, Tok, ExpOnly, WantText, Out);
}

/// _FStringTokenList's own work: the f-string tokens of a record, in order.
void fstringTokenListImpl(PyObject *Logical, std::vector<TokenEntry> &Out) {
  auto *L = host::requireLogicalArg(Logical, "logical");
  for (Py_ssize_t I = 0; I < L->TokenCount; ++I) {
    PyObject *T = L->Texts[I];
    if (L->Types[I] == kStringToken && T && PyString_Check(T) && hasFPrefix(PyString_AS_STRING(T), PyString_GET_SIZE(T)))
      Out.push_back({Ref::borrow(T), L->Positions[I].Row, L->Positions[I].Col});
  }
}

void fstringTokenList(PyObject *Self, PyObject *Logical, std::vector<TokenEntry> &Out) {
  if (!tl::pythonOverride(Self, Names.FStringTokenList)) {
    fstringTokenListImpl(Logical, Out);
    return;
  }
  Ref List = requireList(tl::callMethod(Self, Names.FStringTokenList, Logical));
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(List.get()); ++I) {
    Ref Item = Ref::borrow(PyList_GET_ITEM(List.get(), I));
    Ref Entry[2], Pos[2];
    unpack(Item.get(), 2, Entry);
    unpack(Entry[1].get(), 2, Pos);
    Py_ssize_t Row = toSsize(Pos[0].get()), Col = toSsize(Pos[1].get());
    Out.push_back({std::move(Entry[0]), Row, Col});
  }
}

/// GetExpressionsInLogical's own work: positions count in bytes from the start
/// of the logical's line text.
void expressionsInLogicalImpl(PyObject *Self, PyObject *Logical, bool WantText, std::vector<ExprItem> &Out) {
  auto *L = host::requireLogicalArg(Logical, "logical");
  std::vector<TokenEntry> Tokens;
  fstringTokenList(Self, Logical, Tokens);
  for (TokenEntry &T : Tokens) {
    Py_ssize_t Offset = T.Col;
    if (T.Row > 0) {
      Ref LineText = Ref::borrow(L->LineText ? L->LineText : Py_None);
      Offset += firstLinesLength(LineText.get(), T.Row);
    }
    std::vector<ExprItem> Items = expressionPartList(Self, T.Text.get(), WantText);
    for (ExprItem &It : Items)
      Out.push_back({std::move(It.Text), Offset + It.Pos, std::move(It.Logical)});
  }
}

void expressionsInLogical(PyObject *Self, PyObject *Logical, bool WantText, std::vector<ExprItem> &Out) {
  if (tl::pythonOverride(Self, Names.GetExpressionsInLogical)) {
    itemsFromList(tl::callMethod(Self, Names.GetExpressionsInLogical, Logical), Out);
    return;
  }
  expressionsInLogicalImpl(Self, Logical, WantText, Out);
}

// ---- Python surface ----

FStringSupportObject *self(PyObject *O) { return reinterpret_cast<FStringSupportObject *>(O); }

PyObject *support_new(PyTypeObject *Type, PyObject *, PyObject *) {
  PyObject *O = Type->tp_alloc(Type, 0);
  if (O) {
    self(O)->ExpressionPart = kExpressionPart;
    self(O)->StringPart = kStringPart;
    self(O)->FormatPart = kFormatPart;
    self(O)->ConversionPart = kConversionPart;
  }
  return O;
}

int support_init(PyObject *, PyObject *Args, PyObject *Kwds) {
  if (PyTuple_GET_SIZE(Args) || (Kwds && PyDict_Size(Kwds))) {
    PyErr_SetString(PyExc_TypeError, "CFStringSupport() takes no arguments");
    return -1;
  }
  return 0;
}

bool truthArg(PyObject *O) { return O && tl::isTrue(O); }

PyObject *support_GetFragmentList(PyObject *, PyObject *Contents) {
  return tl::guard<PyObject *>(nullptr, [&] {
    tl::expectType(PyString_Check(Contents), "bytes", Contents);
    std::vector<Fragment> Items;
    cutFragments(PyString_AS_STRING(Contents), PyString_GET_SIZE(Contents), Items);
    Ref List = tl::require(PyList_New(static_cast<Py_ssize_t>(Items.size())));
    for (std::size_t I = 0; I < Items.size(); ++I) {
      PyObject *Pair = Py_BuildValue("(ns#)", Items[I].Offset, Items[I].Text.Data, Items[I].Text.Size);
      if (!Pair)
        throw tl::PyErrSet();
      PyList_SET_ITEM(List.get(), static_cast<Py_ssize_t>(I), Pair);
    }
    return List.release();
  });
}

PyObject *support_RawPartList(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<PyObject *>(nullptr, [&] {
    static const char *Keywords[] = {"s", "exp_only", nullptr};
    PyObject *S, *ExpOnly = nullptr;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "O|O:_RawPartList", const_cast<char **>(Keywords), &S, &ExpOnly))
      throw tl::PyErrSet();
    tl::expectType(PyString_Check(S), "bytes", S);
    std::vector<RawPart> Parts;
    cutParts(Self, PyString_AS_STRING(S), PyString_GET_SIZE(S), truthArg(ExpOnly), Parts);
    Ref List = tl::require(PyList_New(static_cast<Py_ssize_t>(Parts.size())));
    for (std::size_t I = 0; I < Parts.size(); ++I) {
      const RawPart &P = Parts[I];
      PyObject *Triple = Py_BuildValue("(is#n)", P.Kind, P.Text.data(), static_cast<Py_ssize_t>(P.Text.size()), P.Start);
      if (!Triple)
        throw tl::PyErrSet();
      PyList_SET_ITEM(List.get(), static_cast<Py_ssize_t>(I), Triple);
    }
    return List.release();
  });
}

PyObject *support_FStringTokenList(PyObject *, PyObject *Logical) {
  return tl::guard<PyObject *>(nullptr, [&] {
    std::vector<TokenEntry> Tokens;
    fstringTokenListImpl(Logical, Tokens);
    Ref List = tl::require(PyList_New(static_cast<Py_ssize_t>(Tokens.size())));
    for (std::size_t I = 0; I < Tokens.size(); ++I) {
      PyObject *Entry = Py_BuildValue("(O(nn))", Tokens[I].Text.get(), Tokens[I].Row, Tokens[I].Col);
      if (!Entry)
        throw tl::PyErrSet();
      PyList_SET_ITEM(List.get(), static_cast<Py_ssize_t>(I), Entry);
    }
    return List.release();
  });
}

PyObject *support_GetExpressionsInLogical(PyObject *Self, PyObject *Logical) {
  return tl::guard<PyObject *>(nullptr, [&] {
    std::vector<ExprItem> Items;
    expressionsInLogicalImpl(Self, Logical, /*WantText=*/true, Items);
    return itemsToList(Items).release();
  });
}

PyObject *support_GetExpressionPartList(PyObject *Self, PyObject *Tok) {
  return tl::guard<PyObject *>(nullptr, [&] {
    std::vector<ExprItem> Items;
    partList(Self, Tok, /*ExpOnly=*/true, /*WantText=*/true, Items);
    return itemsToList(Items).release();
  });
}

PyObject *support_GetPartList(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<PyObject *>(nullptr, [&] {
    static const char *Keywords[] = {"tok_str", "exp_only", nullptr};
    PyObject *Tok, *ExpOnly = nullptr;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "O|O:GetPartList", const_cast<char **>(Keywords), &Tok, &ExpOnly))
      throw tl::PyErrSet();
    std::vector<ExprItem> Items;
    partListImpl(Self, Tok, truthArg(ExpOnly), /*WantText=*/true, Items);
    return itemsToList(Items).release();
  });
}

PyMethodDef SupportMethods[] = {
    {"_GetFragmentList", support_GetFragmentList, METH_O,
     "_GetFragmentList(contents) -> list of (offset, text): contents cut at quotes, brackets, '!', '=' and ':'"},
    {"_RawPartList", tl::kwFunction(support_RawPartList), METH_VARARGS | METH_KEYWORDS,
     "_RawPartList(s, exp_only=False) -> list of (kind, text, start), start counted from the token's start"},
    {"_FStringTokenList", support_FStringTokenList, METH_O,
     "_FStringTokenList(logical) -> list of (tok_str, (row, col)): the logical's f-string tokens"},
    {"GetExpressionsInLogical", support_GetExpressionsInLogical, METH_O,
     "GetExpressionsInLogical(logical) -> list of (text, pos, logical): every expression of the logical's "
     "f-strings, nested ones included; pos is a byte offset in the logical's line text"},
    {"GetExpressionPartList", support_GetExpressionPartList, METH_O,
     "GetExpressionPartList(tok_str) -> GetPartList(tok_str, exp_only=True)"},
    {"GetPartList", tl::kwFunction(support_GetPartList), METH_VARARGS | METH_KEYWORDS,
     "GetPartList(tok_str, exp_only=False) -> list of (part, part_pos, exp_logical); exp_logical is None "
     "for a part that is not an expression"},
    {nullptr, nullptr, 0, nullptr}};

PyMemberDef SupportMembers[] = {
    {const_cast<char *>("kExpressionPart"), T_INT, offsetof(FStringSupportObject, ExpressionPart), READONLY,
     const_cast<char *>("text between a '{' and the end of the expression")},
    {const_cast<char *>("kStringPart"), T_INT, offsetof(FStringSupportObject, StringPart), READONLY,
     const_cast<char *>("literal text")},
    {const_cast<char *>("kFormatPart"), T_INT, offsetof(FStringSupportObject, FormatPart), READONLY,
     const_cast<char *>("format specification after ':'")},
    {const_cast<char *>("kConversionPart"), T_INT, offsetof(FStringSupportObject, ConversionPart), READONLY,
     const_cast<char *>("conversion after '!'")},
    {nullptr, 0, 0, 0, nullptr}};

} // namespace

PyTypeObject &fstringSupportType() { return FStringSupportType; }

bool isFString(PyObject *Tok) {
  if (!PyString_Check(Tok)) {
    PyErr_Format(PyExc_TypeError, "Expected %.16s, got %.200s", "bytes", Py_TYPE(Tok)->tp_name);
    PyErr_WriteUnraisable(Tok);
    return false;
  }
  const char *S = PyString_AS_STRING(Tok);
  Py_ssize_t N = PyString_GET_SIZE(Tok);
  if (!hasFPrefix(S, N))
    return false;
  int Type = Host.Fast->TokenTypeOfText(S, N);
  if (Type < 0) {
    PyErr_WriteUnraisable(Tok);
    return false;
  }
  return Type == kStringToken;
}

std::vector<ExprItem> expressionPartList(PyObject *Support, PyObject *Tok, bool WantText) {
  std::vector<ExprItem> Items;
  if (tl::pythonOverride(Support, Names.GetExpressionPartList))
    itemsFromList(tl::callMethod(Support, Names.GetExpressionPartList, Tok), Items);
  else
    partList(Support, Tok, /*ExpOnly=*/true, WantText, Items);
  return Items;
}

int initFStringTypes(PyObject *Module) {
  return tl::guard<int>(-1, [&] {
    Names.GetFragmentList = tl::internName("_GetFragmentList");
    Names.RawPartList = tl::internName("_RawPartList");
    Names.FStringTokenList = tl::internName("_FStringTokenList");
    Names.GetExpressionsInLogical = tl::internName("GetExpressionsInLogical");
    Names.GetExpressionPartList = tl::internName("GetExpressionPartList");
    Names.GetPartList = tl::internName("GetPartList");
    tl::TypeDesc D;
    D.Name = "pysource.treelens.CFStringSupport";
    D.Doc = "Splits f-string tokens into parts and their expressions into logical lines.\n\n"
            "Operations return lists rather than iterators; the class keeps no state besides four "
            "constants.";
    D.Size = sizeof(FStringSupportObject);
    D.Methods = SupportMethods;
    D.Members = SupportMembers;
    D.New = support_new;
    D.Init = support_init;
    tl::requireStatus(tl::readyType(FStringSupportType, D));
    tl::requireStatus(tl::addType(Module, "CFStringSupport", FStringSupportType));
    using F = tl::FieldKind;
    tl::registerPickle(FStringSupportType,
                       {{"kExpressionPart", F::Int, offsetof(FStringSupportObject, ExpressionPart)},
                        {"kStringPart", F::Int, offsetof(FStringSupportObject, StringPart)},
                        {"kFormatPart", F::Int, offsetof(FStringSupportObject, FormatPart)},
                        {"kConversionPart", F::Int, offsetof(FStringSupportObject, ConversionPart)}},
                       host::Host.UnpickleFields);
    return 0;
  });
}

} // namespace fstrings
} // namespace treelens
