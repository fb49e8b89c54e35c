// The analyzer's f-string inspection: every expression in a logical line's f-strings is analyzed as
// a logical line of its own, and the names and type equivalences found join the outer line.
#include "pysource/treelens/fstrings/fstrings.h"

#include "override.h"
#include "pysource/treelens/front/front.h"
#include "pysource/treelens/host/host.h"

#include <cstring>
#include <string>

namespace treelens {
namespace fstrings {

using host::Host;
using host::LogicalLineObject;
using tl::Ref;

namespace {

AnalyzerObject *analyzer(PyObject *O) { return reinterpret_cast<AnalyzerObject *>(O); }
LogicalLineObject *record(PyObject *O) { return reinterpret_cast<LogicalLineObject *>(O); }

/// The analyzer's CFStringSupport (or an instance of a subclass).
PyObject *supportOf(AnalyzerObject *A) {
  PyObject *S = A->FStringSupport;
  if (!S || !PyObject_TypeCheck(S, &fstringSupportType()))
    tl::raise(PyExc_TypeError, "_fFStringSupport is not a CFStringSupport");
  return S;
}

/// A snapshot of a record's derived-info list (its appends may target the same record).
Ref snapshot(PyObject *List) {
  if (!List)
    return Ref();
  tl::expectType(PyList_Check(List), "list", List);
  return tl::require(PyList_GetSlice(List, 0, PY_SSIZE_T_MAX));
}

/// Whether Info is a binding within a sub-expression: its prefix, then a token index.
bool isWithinExprInfo(PyObject *Info) {
  PyObject *Prefix = host::sym(host::Sym::kWithinExprPrefix);
  if (!PyString_Check(Info) || !PyString_Check(Prefix))
    return false;
  Py_ssize_t N = PyString_GET_SIZE(Info), P = PyString_GET_SIZE(Prefix);
  const char *S = PyString_AS_STRING(Info);
  if (N <= P || std::memcmp(S, PyString_AS_STRING(Prefix), P) != 0)
    return false;
  for (Py_ssize_t I = P; I < N; ++I)
    if (S[I] < '0' || S[I] > '9')
      return false;
  return true;
}

/// Appends Sub's type equivalences and names defined to Logical. A binding
/// within a sub-expression names a token of Sub; on Logical it names the
/// f-string token TokenI that holds it.
void copyFindings(PyObject *Logical, PyObject *Sub, Py_ssize_t TokenI) {
  Ref Equivs = snapshot(record(Sub)->TypeEquivs);
  Ref Defined = snapshot(record(Sub)->NamesDefined);
  Ref Within;
  for (Py_ssize_t I = 0; Equivs && I < PyList_GET_SIZE(Equivs.get()); ++I) {
    PyObject *Pair = PyList_GET_ITEM(Equivs.get(), I);
    tl::expectType(PyTuple_Check(Pair) && PyTuple_GET_SIZE(Pair) == 2, "tuple", Pair);
    PyObject *Info = PyTuple_GET_ITEM(Pair, 1);
    if (isWithinExprInfo(Info)) {
      if (!Within)
        Within = tl::require(PyString_FromFormat("%s%zd", PyString_AS_STRING(host::sym(host::Sym::kWithinExprPrefix)),
                                                 TokenI));
      Info = Within.get();
    }
    tl::requireStatus(Host.Fast->AppendTypeEquiv(Logical, PyTuple_GET_ITEM(Pair, 0), Info));
  }
  for (Py_ssize_t I = 0; Defined && I < PyList_GET_SIZE(Defined.get()); ++I) {
    PyObject *Name = PyList_GET_ITEM(Defined.get(), I);
    tl::expectType(PyString_Check(Name), "bytes", Name);
    tl::requireStatus(Host.Fast->AppendAttrib(Logical, Name));
  }
}

/// 1-based (line, column) of token TokI of a record as its SyntaxError gives
/// them: past the last token for a completion token, (1, 1) for no tokens.
void errorPosition(LogicalLineObject *L, Py_ssize_t TokI, long &Line, long &Column) {
  Py_ssize_t Count = L->TokenCount;
  Line = Column = 1;
  if (Count == 0)
    return;
  if (TokI >= 0 && TokI < Count) {
    Line = L->Positions[TokI].Row + 1;
    Column = L->Positions[TokI].Col + 1;
    return;
  }
  PyObject *Last = L->Texts[Count - 1];
  Line = L->Positions[Count - 1].Row + 1;
  Column = L->Positions[Count - 1].Col + 1 + (Last && PyString_Check(Last) ? PyString_GET_SIZE(Last) : 0);
}

/// Clears Logical's derived info and raises CPython's parse error located, 1-based,
/// at token SubTokI of the sub-logical Sub, in the outer line's source.
[[noreturn]] void raiseLocated(PyObject *Logical, Py_ssize_t TokenI, PyObject *Text, Py_ssize_t PartPos,
                               PyObject *Sub, Py_ssize_t SubTokI) {
  host::clearDerivedInfo(Logical);

  // The f-string token's own position.
  LogicalLineObject *L = record(Logical);
  Py_ssize_t Count = L->TokenCount;
  Py_ssize_t I = TokenI < Count ? (TokenI < 0 ? TokenI + Count : TokenI) : Count - 1;
  if (I < 0 || I >= Count)
    tl::raise(PyExc_IndexError, "tuple index out of range");
  long Row = L->Positions[I].Row, Col = L->Positions[I].Col;

  // The line, and the column within it, of the part's first byte in the token.
  const char *S = PyString_AS_STRING(Text);
  Py_ssize_t N = PyString_GET_SIZE(Text);
  Py_ssize_t Pos = PartPos < 0 ? 0 : (PartPos > N ? N : PartPos), LineStart = 0;
  for (Py_ssize_t K = 0; K < Pos; ++K) {
    if (S[K] == '\n' || (S[K] == '\r' && (K + 1 == N || S[K + 1] != '\n'))) {
      ++Row;
      LineStart = K + 1;
    }
  }

  long InnerLine, InnerColumn;
  LogicalLineObject *SubL = record(Sub);
  errorPosition(SubL, SubTokI, InnerLine, InnerColumn);
  if (InnerLine == 1 && SubL->FirstLine == 0) {
    Col = (LineStart ? 0 : Col) + static_cast<long>(Pos - LineStart) + InnerColumn - 1;
  } else {
    Row += SubL->FirstLine + InnerLine - 1;
    Col = InnerColumn - 1;
  }

  // CPython parses the expression in parentheses: an error at their end is
  // one past the last token, where its tokenizer has read to the end.
  static PyObject *InvalidSyntax = tl::internName("invalid syntax");
  static PyObject *UnexpectedEnd = tl::internName("unexpected EOF while parsing");
  PyObject *Msg = SubTokI >= SubL->TokenCount ? UnexpectedEnd : InvalidSyntax;
  Ref Source = tl::require(PyObject_CallMethod(Host.LogicalInspect, const_cast<char *>("TextFromTokens"),
                                               const_cast<char *>("(O)"), Logical));
  Ref Error = tl::require(PyObject_CallFunction(PyExc_SyntaxError, const_cast<char *>("(O(sllO))"), Msg,
                                                "<string>", Row + 1, Col + 1, Source.get()));
  PyErr_SetObject(PyExc_SyntaxError, Error.get());
  throw tl::PyErrSet();
}

bool textIs(PyObject *T, const char *Word) {
  Py_ssize_t N = static_cast<Py_ssize_t>(std::strlen(Word));
  return PyString_GET_SIZE(T) == N && std::memcmp(PyString_AS_STRING(T), Word, N) == 0;
}

/// A statement keyword: it never starts an expression.
bool isStatementKeyword(PyObject *T) {
  static const char *const Words[] = {"pass", "break", "continue", "return", "raise", "global", "nonlocal",
                                      "del", "import", "from", "assert", "if", "elif", "else", "while",
                                      "for", "try", "except", "finally", "with", "def", "class", "@"};
  for (const char *W : Words)
    if (textIs(T, W))
      return true;
  return false;
}

/// Outside brackets, a token that only a statement holds: an assignment, an
/// annotation colon or a statement separator.
bool isStatementOperator(PyObject *T) {
  static const char *const Ops[] = {"=",  ":",  ";",  "+=",  "-=",  "*=",  "/=",  "%=", "&=",
                                    "|=", "^=", "<<=", ">>=", "**=", "//=", "@="};
  for (const char *O : Ops)
    if (textIs(T, O))
      return true;
  return false;
}

/// Index of the token that makes Sub a statement rather than an expression,
/// or -1. The grammar parses an expression part as a whole logical line, while
/// the language takes only an expression there: `f'{x = 1}'`, `f'{del x}'` and
/// `f'{a; b}'` are errors, and must not record their bindings.
Py_ssize_t statementToken(LogicalLineObject *Sub) {
  int Depth = 0;
  bool First = true;
  for (Py_ssize_t I = 0; I < Sub->TokenCount; ++I) {
    PyObject *T = Sub->Texts[I];
    if (!T || !PyString_Check(T) || PyString_GET_SIZE(T) == 0)
      continue;
    char C = PyString_AS_STRING(T)[0];
    if (C == '#' || C == '\\')
      continue;
    if (First) {
      First = false;
      if (isStatementKeyword(T))
        return I;
      // async def, async for, async with
      if (textIs(T, "async") && I + 1 < Sub->TokenCount && Sub->Texts[I + 1] && PyString_Check(Sub->Texts[I + 1]) &&
          (textIs(Sub->Texts[I + 1], "def") || textIs(Sub->Texts[I + 1], "for") || textIs(Sub->Texts[I + 1], "with")))
        return I;
    }
    if (PyString_GET_SIZE(T) == 1 && (C == '(' || C == '[' || C == '{'))
      ++Depth;
    else if (PyString_GET_SIZE(T) == 1 && (C == ')' || C == ']' || C == '}'))
      --Depth;
    else if (Depth == 0 && isStatementOperator(T))
      return I;
  }
  return -1;
}

/// Whether the analyzer's version has the self-documenting `f'{x=}'` (3.8 on).
bool hasSelfDocumentingFields(AnalyzerObject *A) {
  PyObject *Triple = A->LogicalParser ? A->LogicalParser->VersionTriple : nullptr;
  if (!Triple)
    return false;
  static PyObject *Py38 = Py_BuildValue("(ii)", 3, 8);
  if (!Py38)
    throw tl::PyErrSet();
  return tl::requireStatus(PyObject_RichCompareBool(Triple, Py38, Py_GE)) != 0;
}

/// Sub without its last token when that is a lone '=': the marker of a
/// self-documenting replacement field (`f'{x=}'`, `f'{x = !r}'`); '==',
/// '!=', '<=' and '>=' are tokens of their own and no marker. Null otherwise.
Ref withoutSelfDocumentingMarker(LogicalLineObject *Sub) {
  Py_ssize_t Last = Sub->TokenCount - 1;
  while (Last >= 0 && Sub->Texts[Last] && PyString_Check(Sub->Texts[Last]) &&
         PyString_GET_SIZE(Sub->Texts[Last]) > 0 && PyString_AS_STRING(Sub->Texts[Last])[0] == '#')
    --Last;
  if (Last < 1 || !Sub->Texts[Last] || !PyString_Check(Sub->Texts[Last]) || !textIs(Sub->Texts[Last], "="))
    return Ref();
  Ref Tokens = tl::require(PyTuple_New(Last));
  for (Py_ssize_t I = 0; I < Last; ++I) {
    PyObject *Entry = Py_BuildValue("(O(ll))", Sub->Texts[I] ? Sub->Texts[I] : Py_None,
                                    static_cast<long>(Sub->Positions[I].Row), static_cast<long>(Sub->Positions[I].Col));
    if (!Entry)
      throw tl::PyErrSet();
    PyTuple_SET_ITEM(Tokens.get(), I, Entry);
  }
  PyObject *LineText = Sub->LineText ? Sub->LineText : Py_None;
  return tl::require(PyObject_CallFunction(reinterpret_cast<PyObject *>(Host.LogicalLineType),
                                           const_cast<char *>("(OilO)"), Tokens.get(), 0,
                                           static_cast<long>(Sub->FirstLine), LineText));
}

/// Whether await and async are keywords in any function (3.7 on), so that
/// an f-string's expression reads them as the enclosing async def does.
bool hasAsyncKeywords(AnalyzerObject *A) {
  PyObject *Triple = A->LogicalParser ? A->LogicalParser->VersionTriple : nullptr;
  if (!Triple)
    return true;
  static PyObject *Py37 = Py_BuildValue("(ii)", 3, 7);
  if (!Py37)
    throw tl::PyErrSet();
  return tl::requireStatus(PyObject_RichCompareBool(Triple, Py37, Py_GE)) != 0;
}

/// The record of Sub's line text in parentheses, or null when that is not one line.
Ref parenthesized(PyObject *Sub) {
  if (!host::isLogical(Sub))
    return Ref();
  PyObject *LineText = record(Sub)->LineText;
  if (!LineText || !PyString_Check(LineText))
    return Ref();
  std::string Text = "(" + std::string(PyString_AS_STRING(LineText), PyString_GET_SIZE(LineText)) + "\n)";
  Ref Logicals = tl::require(Host.Fast->SplitLogicals(Text.data(), static_cast<Py_ssize_t>(Text.size())));
  if (!PyList_Check(Logicals.get()) || PyList_GET_SIZE(Logicals.get()) != 1 ||
      !host::isLogical(PyList_GET_ITEM(Logicals.get(), 0)))
    return Ref();
  return Ref::borrow(PyList_GET_ITEM(Logicals.get(), 0));
}

/// _InspectSingleFStringToken: analyzes each expression of the token Text (at
/// index TokenI of Logical) with f-string inspection suppressed and copies
/// its findings into Logical.
void inspectSingleFStringToken(AnalyzerObject *A, PyObject *Logical, Py_ssize_t TokenI, PyObject *Text,
                               bool InAsyncDef) {
  std::vector<ExprItem> Items = expressionPartList(supportOf(A), Text, /*WantText=*/false);
  for (ExprItem &It : Items) {
    PyObject *Sub = It.Logical ? It.Logical.get() : Py_None;
    if (host::isLogical(Sub) && hasSelfDocumentingFields(A)) {
      if (Ref Stripped = withoutSelfDocumentingMarker(record(Sub))) {
        It.Logical = std::move(Stripped);
        Sub = It.Logical.get();
      }
    }
    if (host::isLogical(Sub)) {
      Py_ssize_t At = statementToken(record(Sub));
      if (At >= 0)
        raiseLocated(Logical, TokenI, Text, It.Pos, Sub, At);
    }
    // 3.6 reads the expression without the enclosing async def's keywords.
    bool Async = InAsyncDef && hasAsyncKeywords(A);
    bool Ok = tl::guard<bool>(false, [&] {
      inspectSingleLogical(A, Sub, Async, /*InFString=*/true);
      return true;
    });
    if (!Ok && PyErr_ExceptionMatches(Host.ParseError)) {
      // An expression that is not a statement on its own, such as a bare
      // generator expression, parses in the parentheses the language reads
      // it in.
      PyObject *Type, *Value, *Tb;
      PyErr_Fetch(&Type, &Value, &Tb);
      Ref Wrapped = parenthesized(Sub);
      if (Wrapped && tl::guard<bool>(false, [&] {
            inspectSingleLogical(A, Wrapped.get(), Async, /*InFString=*/true);
            return true;
          })) {
        Py_XDECREF(Type);
        Py_XDECREF(Value);
        Py_XDECREF(Tb);
        It.Logical = std::move(Wrapped);
        Sub = It.Logical.get();
        Ok = true;
      } else {
        PyErr_Clear();
        PyErr_Restore(Type, Value, Tb);
      }
    }
    if (!Ok) {
      if (PyErr_ExceptionMatches(Host.ParseError))
        raiseLocated(Logical, TokenI, Text, It.Pos, Sub, host::takeParseErrorContext());
      throw tl::PyErrSet();
    }
    copyFindings(Logical, Sub, TokenI);
  }
}

} // namespace

void inspectFStringTokens(PyObject *Analyzer, PyObject *Logical, bool InAsyncDef) {
  LogicalLineObject *L = host::requireLogicalArg(Logical, "logical");
  for (Py_ssize_t I = 0; I < L->TokenCount; ++I) {
    Ref Text = Ref::borrow(host::logicalTokenText(L, I));
    if (!isFString(Text.get()))
      continue;
    inspectSingleFStringToken(analyzer(Analyzer), Logical, I, Text.get(), InAsyncDef);
  }
}

PyObject *analyzer_InspectFStringTokens(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<PyObject *>(nullptr, [&] {
    static const char *Keywords[] = {"logical", "in_async_def", nullptr};
    PyObject *Logical, *InAsyncDef;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "OO:_InspectFStringTokens", const_cast<char **>(Keywords), &Logical,
                                     &InAsyncDef))
      throw tl::PyErrSet();
    inspectFStringTokens(Self, Logical, tl::isTrue(InAsyncDef));
    Py_RETURN_NONE;
  });
}

PyObject *analyzer_InspectSingleFStringToken(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<PyObject *>(nullptr, [&] {
    static const char *Keywords[] = {"logical", "token_i", "text", "in_async_def", nullptr};
    PyObject *Logical, *Text, *InAsyncDef;
    Py_ssize_t TokenI;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "OnOO:_InspectSingleFStringToken", const_cast<char **>(Keywords),
                                     &Logical, &TokenI, &Text, &InAsyncDef))
      throw tl::PyErrSet();
    host::requireLogicalArg(Logical, "logical");
    tl::expectType(PyString_Check(Text), "bytes", Text);
    inspectSingleFStringToken(analyzer(Self), Logical, TokenI, Text, tl::isTrue(InAsyncDef));
    Py_RETURN_NONE;
  });
}

} // namespace fstrings
} // namespace treelens
