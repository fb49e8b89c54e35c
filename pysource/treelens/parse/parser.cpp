// CPGenParserImpl: feeds a logical line's tokens to the pgen engine, completing incomplete statements.
#include "pysource/treelens/parse/parse.h"

#include "fieldpickle.h"
#include "pysource/treelens/front/front.h"
#include "pysource/treelens/host/host.h"

#include <cstring>
#include <memory>

namespace treelens {

using host::Host;
using tl::Ref;

namespace {

PyTypeObject ParserType;

ParserObject *self(PyObject *O) { return reinterpret_cast<ParserObject *>(O); }

constexpr const char *kBusyMessage = "CPGenParserImpl is busy: it may not be re-entered or re-initialised "
                                     "while it parses";

/// Refuses to change a parser while it parses (its __init__, __setstate__).
void requireIdle(PyObject *O) {
  if (self(O)->Busy)
    tl::raise(PyExc_RuntimeError, kBusyMessage);
}

/// Before __setstate__: idle, and the grammar's retyped tokens read again.
void beforeSetState(PyObject *O) {
  requireIdle(O);
  self(O)->Retyped = 0;
}

/// A token the parser feeds of its own accord, with its type as the host classifies it.
struct SynthToken {
  PyObject *Text;
  int Type;
};

struct SynthTokens {
  SynthToken If, Zero, Colon, Equal, Pass, Newline, Try, Finally, Def, Function, LPar, RPar, Dot;
  PyObject *Elif, *Except, *Else, *Async, *Await, *InvalidSyntax;
  PyObject *With, *As, *Type;
  SynthToken Match, Case;
};
SynthTokens Synth;

SynthToken makeSynth(const char *Text) {
  SynthToken T{tl::internName(Text), 0};
  T.Type = Host.Fast->TokenTypeOfText(Text, static_cast<Py_ssize_t>(std::strlen(Text)));
  if (T.Type < 0)
    throw tl::PyErrSet();
  return T;
}

bool textIs(PyObject *Text, PyObject *Word) {
  Py_ssize_t N = PyString_GET_SIZE(Word);
  return Text == Word || (PyString_GET_SIZE(Text) == N &&
                          std::memcmp(PyString_AS_STRING(Text), PyString_AS_STRING(Word), N) == 0);
}

// ---- The engine ----

void engineSetup(ParserObject *P, int Start) {
  const optpgen::ParserApi *Api = Host.ParserApi;
  if (Api && Py_TYPE(P->Parser) == Api->ParserType) {
    tl::requireStatus(Api->Setup(P->Parser, Start));
    return;
  }
  Ref S = tl::require(PyInt_FromLong(Start));
  tl::require(PyObject_CallFunctionObjArgs(P->SetupMethod, S.get(), nullptr));
}

void engineAddToken(ParserObject *P, int Type, PyObject *Value, PyObject *Context) {
  const optpgen::ParserApi *Api = Host.ParserApi;
  if (Api && Py_TYPE(P->Parser) == Api->ParserType) {
    tl::requireStatus(Api->AddToken(P->Parser, Type, Value, Context));
    return;
  }
  Ref T = tl::require(PyInt_FromLong(Type));
  tl::require(PyObject_CallFunctionObjArgs(P->AddTokenMethod, T.get(), Value, Context, nullptr));
}

Ref engineRoot(ParserObject *P) {
  const optpgen::ParserApi *Api = Host.ParserApi;
  if (Api && Py_TYPE(P->Parser) == Api->ParserType)
    return tl::require(Api->GetRootNode(P->Parser));
  return tl::require(PyObject_CallFunctionObjArgs(P->GetRootNodeMethod, nullptr));
}

void requireReady(ParserObject *P) {
  if (!P->Parser || !P->Factory)
    tl::raise(PyExc_ValueError, "CPGenParserImpl is not initialised");
  if (!P->SetupMethod) {
    P->SetupMethod = tl::require(PyObject_GetAttrString(P->Parser, "setup")).release();
    P->AddTokenMethod = tl::require(PyObject_GetAttrString(P->Parser, "addtoken")).release();
    P->GetRootNodeMethod = tl::require(PyObject_GetAttrString(P->Parser, "getrootnode")).release();
  }
}

/// _AddTokenList over synthetic tokens, each with context Context.
void addSynth(ParserObject *P, std::initializer_list<const SynthToken *> Tokens, PyObject *Context) {
  for (const SynthToken *T : Tokens)
    engineAddToken(P, T->Type, T->Text, Context);
}

/// _AddTokenList(token_list, context) from Python: each text must be bytes.
void addTokenList(ParserObject *P, PyObject *TokenList, PyObject *Context) {
  Ref Seq = tl::require(PySequence_Fast(TokenList, "token list must be a sequence"));
  for (Py_ssize_t I = 0; I < PySequence_Fast_GET_SIZE(Seq.get()); ++I) {
    // Held: feeding it may run Python code that changes the list.
    Ref Text = Ref::borrow(PySequence_Fast_GET_ITEM(Seq.get(), I));
    tl::expectType(PyString_Check(Text.get()), "bytes", Text.get());
    int Type = Host.Fast->TokenTypeOfText(PyString_AS_STRING(Text.get()), PyString_GET_SIZE(Text.get()));
    if (Type < 0)
      throw tl::PyErrSet();
    engineAddToken(P, Type, Text.get(), Context);
  }
}

/// _ShouldSkipSlash: a backslash that ends its physical line (a line continuation).
bool shouldSkipSlash(ParserObject *P, Py_ssize_t TokI) {
  if (!P->Logical)
    tl::raise(PyExc_AttributeError, "'NoneType' object has no attribute 'fTokens'");
  auto *L = host::requireLogical(P->Logical);
  if (TokI < 0 || TokI >= L->TokenCount)
    return false;
  PyObject *T = L->Texts[TokI];
  if (!T || !PyString_Check(T) || PyString_GET_SIZE(T) != 1 || PyString_AS_STRING(T)[0] != '\\')
    return false;
  if (TokI == L->TokenCount - 1)
    return true;
  return L->Positions[TokI + 1].Row > L->Positions[TokI].Row;
}

/// The tokens of one parse, read before any Python code can run (a token's
/// __hash__ or __eq__, a converter, a finaliser may re-initialise the record
/// or empty the list): the texts, held, their types, and whether a backslash
/// is a line continuation the parser skips.
class TokenSnapshot {
public:
  struct Token {
    PyObject *Text; ///< owned bytes
    int Type;
    bool Continuation;
  };

  TokenSnapshot() = default;
  TokenSnapshot(const TokenSnapshot &) = delete;
  TokenSnapshot &operator=(const TokenSnapshot &) = delete;
  ~TokenSnapshot() {
    for (Py_ssize_t I = 0; I < Count; ++I)
      Py_DECREF(Toks[I].Text);
  }

  /// The tokens of a logical-line record.
  void readLogical(host::LogicalLineObject *L) {
    const Py_ssize_t N = L->TokenCount;
    reserve(N);
    for (Py_ssize_t I = 0; I < N; ++I) {
      PyObject *T = L->Texts[I] ? L->Texts[I] : Py_None;
      tl::expectType(PyString_Check(T), "bytes", T);
      // A backslash continues the line when it ends its physical line.
      bool Continuation = PyString_GET_SIZE(T) == 1 && PyString_AS_STRING(T)[0] == '\\' &&
                          (I == N - 1 || L->Positions[I + 1].Row > L->Positions[I].Row);
      add(T, L->Types[I], Continuation);
    }
    IsTry = L->Kind == 11;
  }

  /// A plain list of token texts. A backslash in a list is always a line
  /// continuation: a list has no positions to tell otherwise.
  void readList(PyObject *List) {
    const Py_ssize_t N = PyList_GET_SIZE(List);
    reserve(N);
    for (Py_ssize_t I = 0; I < N; ++I) {
      PyObject *T = PyList_GET_ITEM(List, I);
      tl::expectType(PyString_Check(T), "bytes", T);
      int Type = Host.Fast->TokenTypeOfText(PyString_AS_STRING(T), PyString_GET_SIZE(T));
      if (Type < 0)
        throw tl::PyErrSet();
      add(T, Type, true);
    }
    IsTry = N > 0 && textIs(Toks[0].Text, Synth.Try.Text);
  }

  Py_ssize_t count() const { return Count; }
  const Token &operator[](Py_ssize_t I) const { return Toks[I]; }
  bool isTry() const { return IsTry; }

  /// Borrowed text of the first token after I that is no comment or
  /// backslash, or nullptr.
  PyObject *nextKept(Py_ssize_t I) const {
    Py_ssize_t J = nextKeptIndex(I);
    return J < Count ? Toks[J].Text : nullptr;
  }

  /// Index of the first token after I that is no comment or backslash, or count().
  Py_ssize_t nextKeptIndex(Py_ssize_t I) const {
    for (Py_ssize_t J = I + 1; J < Count; ++J) {
      PyObject *T = Toks[J].Text;
      if (PyString_GET_SIZE(T) == 0 || (PyString_AS_STRING(T)[0] != '\\' && PyString_AS_STRING(T)[0] != '#'))
        return J;
    }
    return Count;
  }

  /// Index of the last token that is no comment or backslash, or -1.
  Py_ssize_t lastKeptIndex() const {
    for (Py_ssize_t J = Count - 1; J >= 0; --J) {
      PyObject *T = Toks[J].Text;
      if (PyString_GET_SIZE(T) == 0 || (PyString_AS_STRING(T)[0] != '\\' && PyString_AS_STRING(T)[0] != '#'))
        return J;
    }
    return -1;
  }

private:
  static constexpr Py_ssize_t InlineSize = 64;

  void reserve(Py_ssize_t N) {
    if (N > InlineSize) {
      Heap.reset(new Token[static_cast<size_t>(N)]);
      Toks = Heap.get();
    }
  }
  void add(PyObject *Text, int Type, bool Continuation) {
    Py_INCREF(Text);
    Toks[Count++] = Token{Text, Type, Continuation};
  }

  Token Inline[InlineSize];
  std::unique_ptr<Token[]> Heap;
  Token *Toks = Inline;
  Py_ssize_t Count = 0; ///< Toks[0, Count) are filled
  bool IsTry = false;
};

/// Marks a parser busy for one parse and keeps it alive meanwhile: Python code
/// run by the parse may drop the last other reference to it.
class ParseScope {
public:
  explicit ParseScope(ParserObject *P) : P(P), Hold(Ref::borrow(reinterpret_cast<PyObject *>(P))) {
    if (P->Busy)
      tl::raise(PyExc_RuntimeError, kBusyMessage);
    P->Busy = true;
  }
  ~ParseScope() { P->Busy = false; }

private:
  ParserObject *P;
  Ref Hold;
};

/// Pops and returns item 0 of a node's children. New reference.
Ref popFirstChild(NodeObject *N) {
  Ref First = Ref::borrow(PyList_GET_ITEM(N->Children, 0));
  tl::requireStatus(PyList_SetSlice(N->Children, 0, 1, nullptr));
  return First;
}

/// The statement node from the file_input root, or None (the root is discarded).
Ref takeStatement(ParserObject *P, Ref Root, bool Decorator) {
  if (PyTuple_Check(Root.get()))
    Root = recursiveConvert(P->Factory, Root.get());
  if (!isNode(Root.get()))
    return Ref::borrow(Py_None);
  NodeObject *R = reinterpret_cast<NodeObject *>(Root.get());
  bool Usable = false;
  if (R->Children && PyList_GET_SIZE(R->Children) == 2) {
    PyObject *Second = PyList_GET_ITEM(R->Children, 1);
    Usable = isNode(Second) && reinterpret_cast<NodeObject *>(Second)->ClsInfo &&
             reinterpret_cast<NodeObject *>(Second)->ClsInfo->NodeType == kEndMarker;
  }
  if (!Usable) {
    discardNodes(Root.get(), 0);
    return Ref::borrow(Py_None);
  }
  Ref Stmt = popFirstChild(R);
  discardNodes(Root.get(), 0);
  if (!Decorator || !isNode(Stmt.get()))
    return Stmt;
  // The decorators and the synthetic function: keep the decorators only.
  NodeObject *S = reinterpret_cast<NodeObject *>(Stmt.get());
  if (!S->Children || PyList_GET_SIZE(S->Children) != 2)
    return Stmt;
  Ref Decorators = popFirstChild(S);
  discardNodes(Stmt.get(), 0);
  return Decorators;
}

/// Whether the grammar has a label for token type Type (its `tokens` map).
bool grammarHasToken(ParserObject *P, int Type) {
  Ref Tokens = tl::require(PyObject_GetAttrString(P->Grammar, "tokens"));
  Ref Key = tl::require(PyInt_FromLong(Type));
  return tl::requireStatus(PySequence_Contains(Tokens.get(), Key.get())) != 0;
}

/// Feeds a `:=` token as the two operators ':' and '=' it is before 3.8. A
/// grammar that rejects the '=' gets the SyntaxError at the '=' itself, one
/// byte past the token's start, as those versions' own tokenizer places it.
void addSplitColonEqual(ParserObject *P, Py_ssize_t TokI, PyObject *Context) {
  addSynth(P, {&Synth.Colon}, Context);
  try {
    addSynth(P, {&Synth.Equal}, Context);
  } catch (const tl::PyErrSet &) {
    if (!P->Logical || !PyErr_ExceptionMatches(Host.ParseError))
      throw;
    PyErr_Clear();
    Ref Error = createSyntaxError(Synth.InvalidSyntax, P->Logical, TokI);
    Ref Offset = tl::require(PyObject_GetAttrString(Error.get(), "offset"));
    Ref Next = tl::require(PyNumber_Add(Offset.get(), tl::require(PyInt_FromLong(1)).get()));
    Ref Lineno = tl::require(PyObject_GetAttrString(Error.get(), "lineno"));
    Ref Text = tl::require(PyObject_GetAttrString(Error.get(), "text"));
    Ref Moved = tl::require(PyObject_CallFunction(PyExc_SyntaxError, const_cast<char *>("(O(sOOO))"),
                                                  Synth.InvalidSyntax, "<string>", Lineno.get(), Next.get(),
                                                  Text.get()));
    PyErr_SetObject(PyExc_SyntaxError, Moved.get());
    throw;
  }
}

/// The kHas* bits of the parser's grammar, read once.
int retypedTokens(ParserObject *P) {
  if (!(P->Retyped & kRetypedKnown)) {
    int Bits = kRetypedKnown;
    if (P->Py3Grammar) {
      Bits |= grammarHasToken(P, kMatch) ? kHasMatch : 0;
      Bits |= grammarHasToken(P, kType) ? kHasType : 0;
      Bits |= grammarHasToken(P, kWithLpar) ? kHasWithLpar : 0;
    }
    P->Retyped = Bits;
  }
  return P->Retyped;
}

/// Whether the '(' at Open, right after `with`, holds parenthesized with items:
/// its ')' is followed by the header's ':' and it holds a top-level ',' or `as`.
/// `with (a, b) as c:` and `with (a):` keep the '(' of an expression.
bool opensWithItems(const TokenSnapshot &S, Py_ssize_t Open) {
  int Depth = 0;
  bool Items = false;
  for (Py_ssize_t J = Open; J < S.count(); ++J) {
    int T = S[J].Type;
    if (T == 7 || T == 9 || T == 26) {
      ++Depth;
    } else if (T == 8 || T == 10 || T == 27) {
      if (--Depth == 0) {
        Py_ssize_t Next = S.nextKeptIndex(J);
        return Items && Next < S.count() && S[Next].Type == kColon;
      }
    } else if (Depth == 1 && (T == 12 || (T == kName && textIs(S[J].Text, Synth.As)))) {
      Items = true;
    }
  }
  return false;
}

/// How the first token of a line is read where the grammar has soft keywords.
enum class SoftHead { None, Keyword, Name };

Ref parseTokens(ParserObject *P, const TokenSnapshot &S, bool AsyncKw, SoftHead Soft = SoftHead::None) {
  engineSetup(P, P->FileInputNumber);
  const int Retyped = retypedTokens(P);
  bool First = true, Decorator = false;
  int LastType = -1;
  Py_ssize_t WithLpar = -1;
  bool MatchHeader = false; ///< a match statement's header: its block follows on later lines
  Py_ssize_t Count = S.count();
  for (Py_ssize_t I = 0; I < Count; ++I) {
    PyObject *Tok = S[I].Text;
    int TokType = S[I].Type;
    Ref Context = tl::require(PyInt_FromSsize_t(I));
    if (First && TokType == kName) {
      // Clauses that continue a compound statement get a synthetic head.
      if (textIs(Tok, Synth.Elif)) {
        Tok = Synth.If.Text;
      } else if (textIs(Tok, Synth.Except) || textIs(Tok, Synth.Finally.Text)) {
        addSynth(P, {&Synth.Try, &Synth.Colon, &Synth.Pass, &Synth.Newline}, Context.get());
      } else if (textIs(Tok, Synth.Else)) {
        addSynth(P, {&Synth.If, &Synth.Zero, &Synth.Colon, &Synth.Pass, &Synth.Newline}, Context.get());
      } else if (Soft == SoftHead::Keyword) {
        // match and case as keywords; a lone case clause gets a `match 0:` head.
        if (textIs(Tok, Synth.Case.Text)) {
          addSynth(P, {&Synth.Match, &Synth.Zero, &Synth.Colon}, Context.get());
          TokType = kCase;
        } else {
          TokType = kMatch;
          MatchHeader = true;
        }
      } else if (!AsyncKw && textIs(Tok, Synth.Async)) {
        // An async def: as in the language's own tokenizer, async and await
        // are keywords from here on, so a body on the same line may await.
        PyObject *Next = S.nextKept(I);
        if (Next && textIs(Next, Synth.Def.Text)) {
          TokType = kAsync;
          AsyncKw = true;
        }
      }
    } else if (First && TokType == kAt) {
      Decorator = true;
    }
    if (AsyncKw && TokType == kName) {
      if (textIs(Tok, Synth.Async))
        TokType = kAsync;
      else if (textIs(Tok, Synth.Await))
        TokType = kAwait;
    }
    if (Retyped > kRetypedKnown && TokType == kName) {
      if ((Retyped & kHasType) && textIs(Tok, Synth.Type)) {
        // `type` followed by a name that is no keyword starts a type statement:
        // two adjacent names are nothing else.
        Py_ssize_t Next = S.nextKeptIndex(I);
        if (Next < Count && S[Next].Type == kName && !PyDict_GetItem(P->Keywords, S[Next].Text))
          TokType = kType;
      } else if ((Retyped & kHasWithLpar) && textIs(Tok, Synth.With)) {
        Py_ssize_t Next = S.nextKeptIndex(I);
        if (Next < Count && S[Next].Type == 7 && opensWithItems(S, Next))
          WithLpar = Next;
      }
    } else if (I == WithLpar) {
      TokType = kWithLpar;
    }
    if (TokType == kComment)
      continue;
    if (TokType == kBackslash && S[I].Continuation)
      continue;
    if (TokType == kColonEqual && !grammarHasToken(P, kColonEqual)) {
      addSplitColonEqual(P, I, Context.get());
      First = false;
      LastType = Synth.Equal.Type;
      continue;
    }
    if (TokType == kEllipsis && !P->Py3Grammar) {
      addSynth(P, {&Synth.Dot, &Synth.Dot, &Synth.Dot}, Context.get());
      continue;
    }
    engineAddToken(P, TokType, Tok, Context.get());
    First = false;
    LastType = TokType;
  }

  Ref End = tl::require(PyInt_FromSsize_t(Count));
  if (S.isTry()) {
    if (LastType == kColon)
      addSynth(P, {&Synth.Pass}, End.get());
    addSynth(P, {&Synth.Newline, &Synth.Finally, &Synth.Colon, &Synth.Pass}, End.get());
  } else if (Decorator) {
    addSynth(P,
             {&Synth.Newline, &Synth.Def, &Synth.Function, &Synth.LPar, &Synth.RPar, &Synth.Colon,
              &Synth.Pass},
             End.get());
  } else if (LastType == kColon && !MatchHeader) {
    engineAddToken(P, kName, Synth.Pass.Text, End.get());
  }
  engineAddToken(P, kNewline, Synth.Newline.Text, End.get());
  engineAddToken(P, kEndMarker, Py_None, End.get());
  return takeStatement(P, engineRoot(P), Decorator);
}

/// The token index of a pending ParseError (its context), or -1.
Py_ssize_t pendingParseErrorIndex() {
  PyObject *Type, *Value, *Tb;
  PyErr_Fetch(&Type, &Value, &Tb);
  PyErr_NormalizeException(&Type, &Value, &Tb);
  Py_ssize_t I = -1;
  if (Value) {
    PyObject *Context = PyObject_GetAttrString(Value, "context");
    if (Context && PyInt_Check(Context))
      I = PyInt_AsSsize_t(Context);
    Py_XDECREF(Context);
  }
  PyErr_Clear();
  PyErr_Restore(Type, Value, Tb);
  return I;
}

/// Whether a line that starts with the name `match` or `case` may be a match
/// statement or case clause: a `match` line ends with ':', and neither is
/// followed by '=', '.' or an operator that only continues an expression.
bool mayBeSoftKeywordLine(ParserObject *P, const TokenSnapshot &S) {
  if (!(retypedTokens(P) & kHasMatch) || S.count() < 2 || S[0].Type != kName)
    return false;
  bool IsMatch = textIs(S[0].Text, Synth.Match.Text);
  if (!IsMatch && !textIs(S[0].Text, Synth.Case.Text))
    return false;
  Py_ssize_t Next = S.nextKeptIndex(0);
  if (Next >= S.count())
    return false;
  int T = S[Next].Type;
  // Tokens that cannot start a subject or pattern: '=', '.', ':', ')', ']',
  // '}', ',', ';' and the augmented assignments.
  if (T == 22 || T == 23 || T == kColon || T == 8 || T == 10 || T == 27 || T == 12 || T == 13 ||
      (T >= 37 && T <= 47) || T == 49 || T == kColonEqual)
    return false;
  if (IsMatch) {
    Py_ssize_t Last = S.lastKeptIndex();
    return Last > 0 && S[Last].Type == kColon;
  }
  return true;
}

/// parseTokens for a line that may start with a soft keyword: read as a match
/// statement or case clause first, and as an ordinary statement when that
/// fails (`match(x)`, `case = 1`). When both fail, the error further right
/// is raised (the reading that went further), the ordinary one on a tie.
Ref parseLine(ParserObject *P, const TokenSnapshot &S, bool AsyncKw) {
  if (!mayBeSoftKeywordLine(P, S))
    return parseTokens(P, S, AsyncKw);
  PyObject *Type, *Value, *Tb;
  Py_ssize_t KeywordAt;
  try {
    return parseTokens(P, S, AsyncKw, SoftHead::Keyword);
  } catch (const tl::PyErrSet &) {
    if (!PyErr_ExceptionMatches(Host.ParseError))
      throw;
    KeywordAt = pendingParseErrorIndex();
    PyErr_Fetch(&Type, &Value, &Tb);
  }
  Ref Held[] = {Ref::steal(Type), Ref::steal(Value), Ref::steal(Tb)};
  try {
    return parseTokens(P, S, AsyncKw, SoftHead::Name);
  } catch (const tl::PyErrSet &) {
    if (!PyErr_ExceptionMatches(Host.ParseError))
      throw;
    if (KeywordAt > pendingParseErrorIndex()) {
      PyErr_Clear();
      PyErr_Restore(Held[0].release(), Held[1].release(), Held[2].release());
    }
    throw;
  }
}

/// The converter callback the engine calls for every token and reduced rule.
PyObject *parserConvert(PyObject *Converter, PyObject *, int NodeType, PyObject *Value, PyObject *Context,
                        PyObject *Children) {
  return tl::guard<PyObject *>(nullptr, [&] {
    ParserObject *P = self(Converter);
    requireReady(P);
    // Held: converting may run Python code that re-initialises P.
    Ref Factory = Ref::borrow(reinterpret_cast<PyObject *>(P->Factory));
    return convertSingleNode(P->Factory, NodeType, Value, Context, Children).release();
  });
}

/// The name a grammar rule text defines: the text before the first ":", stripped.
Ref ruleName(PyObject *Rule) {
  tl::expectType(PyString_Check(Rule), "bytes", Rule);
  const char *S = PyString_AS_STRING(Rule);
  Py_ssize_t N = PyString_GET_SIZE(Rule);
  const char *Colon = static_cast<const char *>(std::memchr(S, ':', N));
  Py_ssize_t End = Colon ? Colon - S : N, Begin = 0;
  while (Begin < End && std::strchr(" \t\n\r\f\v", S[Begin]))
    ++Begin;
  while (End > Begin && std::strchr(" \t\n\r\f\v", S[End - 1]))
    --End;
  return tl::require(PyString_FromStringAndSize(S + Begin, End - Begin));
}

/// _BuildClsForStateList: merges the classes' kSupportedRules into
/// kClsForState and maps every state number to its node class.
Ref buildClsForStateList(ParserObject *P) {
  Ref ClsForState = tl::require(PyObject_GetAttrString(reinterpret_cast<PyObject *>(&ParserType),
                                                        "kClsForState"));
  tl::expectType(PyDict_Check(ClsForState.get()), "dict", ClsForState.get());
  Ref Items = tl::require(PyDict_Values(Host.ModuleDict));
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Items.get()); ++I) {
    PyObject *Value = PyList_GET_ITEM(Items.get(), I);
    if (Py_TYPE(Value) != &PyType_Type ||
        !PyType_IsSubtype(reinterpret_cast<PyTypeObject *>(Value), &cnodeType()))
      continue;
    Ref Rules = tl::require(PyObject_GetAttrString(Value, "kSupportedRules"));
    Ref Iter = tl::require(PyObject_GetIter(Rules.get()));
    while (PyObject *Rule = PyIter_Next(Iter.get())) {
      Ref Hold = Ref::steal(Rule);
      tl::requireStatus(PyDict_SetItem(ClsForState.get(), ruleName(Rule).get(), Value));
    }
    if (PyErr_Occurred())
      throw tl::PyErrSet();
  }
  Ref Number2Symbol = tl::require(PyObject_GetAttrString(P->Grammar, "number2symbol"));
  tl::expectType(PyDict_Check(Number2Symbol.get()), "dict", Number2Symbol.get());
  long Max = -1;
  PyObject *Key, *Value;
  Py_ssize_t Pos = 0;
  while (PyDict_Next(Number2Symbol.get(), &Pos, &Key, &Value)) {
    long K = PyInt_AsLong(Key);
    if (K == -1 && PyErr_Occurred())
      throw tl::PyErrSet();
    Max = K > Max ? K : Max;
  }
  // The grammar object may be the caller's: its numbers size the list.
  if (Max > kMaxStateNumber)
    tl::raiseFormat(PyExc_ValueError, "grammar symbol number out of range: %ld", Max);
  Ref Result = tl::require(PyList_New(0));
  for (long I = 0; I <= Max; ++I) {
    Ref Number = tl::require(PyInt_FromLong(I));
    PyObject *Name = PyDict_GetItem(Number2Symbol.get(), Number.get());
    if (!Name)
      Name = PyDict_GetItem(Host.TokName, Number.get());
    PyObject *Cls = Name ? PyDict_GetItem(ClsForState.get(), Name) : nullptr;
    tl::requireStatus(PyList_Append(Result.get(), Cls ? Cls : reinterpret_cast<PyObject *>(&cnodeType())));
  }
  return Result;
}

// ---- Python surface ----

PyObject *parser_new(PyTypeObject *Type, PyObject *, PyObject *) {
  return tl::guard<PyObject *>(nullptr, [&] {
    Ref Empty = tl::require(PyTuple_New(0));
    Ref Obj = tl::require(Host.NodeConverterType->tp_new(Type, Empty.get(), nullptr));
    reinterpret_cast<optpgen::NodeConverterObject *>(Obj.get())->NativeConvert = parserConvert;
    return Obj.release();
  });
}

int parser_init(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<int>(-1, [&] {
    static const char *Keywords[] = {"version_triple", "grammar_file", "keyword_seq", "py3_grammar", nullptr};
    PyObject *VersionTriple, *GrammarFile = nullptr, *KeywordSeq = Py_None, *Py3Grammar = Py_True;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "O|OOO:CPGenParserImpl", const_cast<char **>(Keywords),
                                     &VersionTriple, &GrammarFile, &KeywordSeq, &Py3Grammar))
      throw tl::PyErrSet();
    requireIdle(Self);
    tl::expectType(PyTuple_Check(VersionTriple), "tuple", VersionTriple);
    ParserObject *P = self(Self);
    Ref Grammar = GrammarFile ? Ref::borrow(GrammarFile)
                              : tl::require(PyString_FromString("Python-Grammar-3.5"));
    Ref Abs = tl::require(PyObject_CallFunctionObjArgs(Host.IsAbs, Grammar.get(), nullptr));
    if (!tl::requireStatus(PyObject_IsTrue(Abs.get()))) {
      Ref Prefix = tl::require(PyString_FromString("resources/pgen-grammars/"));
      Ref Relative = tl::require(PyNumber_Add(Prefix.get(), Grammar.get()));
      Grammar = tl::require(PyObject_CallMethod(Host.Config, const_cast<char *>("GetLoomFilename"),
                                                const_cast<char *>("(O)"), Relative.get()));
    }
    Ref KeywordList = Ref::borrow(KeywordSeq == Py_None ? Host.KeywordList : KeywordSeq);

    Ref TokNumber2Name = tl::require(PyDict_Copy(Host.TokName));
    for (auto Entry : {std::make_pair(51, "RARROW"), std::make_pair(54, "ASYNC"), std::make_pair(53, "AWAIT"),
                       std::make_pair(55, "COLONEQUAL"), std::make_pair(56, "ATEQUAL"),
                       std::make_pair(int(kMatch), "MATCH"), std::make_pair(int(kCase), "CASE"),
                       std::make_pair(int(kType), "TYPE"), std::make_pair(int(kWithLpar), "WITH_LPAR")}) {
      Ref K = tl::require(PyInt_FromLong(Entry.first));
      Ref V = tl::require(PyString_FromString(Entry.second));
      tl::requireStatus(PyDict_SetItem(TokNumber2Name.get(), K.get(), V.get()));
    }
    Ref OpText2Number = tl::require(PyDict_Copy(Host.OpMap));
    for (auto Entry : {std::make_pair("...", 52), std::make_pair("->", 51), std::make_pair(":=", 55),
                       std::make_pair("@=", 56)}) {
      Ref V = tl::require(PyInt_FromLong(Entry.second));
      tl::requireStatus(PyDict_SetItemString(OpText2Number.get(), Entry.first, V.get()));
    }
    Ref GenArgs = tl::require(PyTuple_Pack(1, Grammar.get()));
    Ref GenKwds = tl::require(Py_BuildValue("{sOsO}", "tok_number2name", TokNumber2Name.get(),
                                            "op_text2number", OpText2Number.get()));
    Ref Generator = tl::require(PyObject_Call(Host.ParserGenerator, GenArgs.get(), GenKwds.get()));
    Ref Gram = tl::require(PyObject_CallMethod(Generator.get(), const_cast<char *>("make_grammar"), nullptr));
    Py_XSETREF(P->Grammar, Gram.release());
    P->Retyped = 0;

    P->Py3Grammar = tl::requireStatus(PyObject_IsTrue(Py3Grammar)) != 0;
    Py_INCREF(VersionTriple);
    Py_XSETREF(P->VersionTriple, VersionTriple);
    Ref Py37 = tl::require(Py_BuildValue("(ii)", 3, 7));
    P->AsyncAlwaysKeyword = tl::requireStatus(PyObject_RichCompareBool(VersionTriple, Py37.get(), Py_GE)) != 0;

    Ref KeywordDict = tl::require(PyDict_New());
    Ref Iter = tl::require(PyObject_GetIter(KeywordList.get()));
    while (PyObject *Kw = PyIter_Next(Iter.get())) {
      Ref Hold = Ref::steal(Kw);
      tl::requireStatus(PyDict_SetItem(KeywordDict.get(), Kw, Py_None));
    }
    if (PyErr_Occurred())
      throw tl::PyErrSet();
    Py_XSETREF(P->Keywords, KeywordDict.release());

    // CPython's parser stack holds 1500 nonterminals before 3.8 and 1700 from 3.8 on.
    Ref Py38 = tl::require(Py_BuildValue("(ii)", 3, 8));
    long MaxDepth = tl::requireStatus(PyObject_RichCompareBool(VersionTriple, Py38.get(), Py_GE)) ? 1700 : 1500;
    Ref CreateKwds =
        tl::require(Py_BuildValue("{sOsl}", "promotesinglechild", Py_True, "maxdepth", MaxDepth));
    Ref CreateArgs = tl::require(PyTuple_Pack(2, P->Grammar, Self));
    Py_XSETREF(P->Parser, tl::require(PyObject_Call(Host.CreateParser, CreateArgs.get(), CreateKwds.get()))
                              .release());
    Py_CLEAR(P->SetupMethod);
    Py_CLEAR(P->AddTokenMethod);
    Py_CLEAR(P->GetRootNodeMethod);

    Ref Symbol2Number = tl::require(PyObject_GetAttrString(P->Grammar, "symbol2number"));
    Ref FileInput = tl::require(PyObject_GetItem(Symbol2Number.get(), tl::require(PyString_FromString("file_input")).get()));
    long Start = PyInt_AsLong(FileInput.get());
    if (Start == -1 && PyErr_Occurred())
      throw tl::PyErrSet();
    P->FileInputNumber = static_cast<int>(Start);

    Py_XSETREF(P->ClsForStateList, buildClsForStateList(P).release());
    Ref FactoryArgs = tl::require(PyTuple_Pack(4, P->Grammar, P->ClsForStateList, P->Keywords,
                                               TokNumber2Name.get()));
    Ref Factory = tl::require(PyObject_Call(reinterpret_cast<PyObject *>(&factoryType()), FactoryArgs.get(), nullptr));
    Py_XSETREF(P->Factory, reinterpret_cast<FactoryObject *>(Factory.release()));

    Py_INCREF(Host.TimeTime);
    Py_XSETREF(P->GetTime, Host.TimeTime);
    Py_XSETREF(P->CLogicalLine, tl::require(PyObject_GetAttrString(Host.LogicalLine, "LogicalLineType")).release());
    Py_CLEAR(P->Logical);
    return 0;
  });
}

int parser_traverse(PyObject *Self, visitproc visit, void *arg) {
  ParserObject *P = self(Self);
  Py_VISIT(P->Grammar);
  Py_VISIT(P->Keywords);
  Py_VISIT(P->Parser);
  Py_VISIT(P->Factory);
  Py_VISIT(P->Logical);
  Py_VISIT(P->ClsForStateList);
  Py_VISIT(P->GetTime);
  Py_VISIT(P->CLogicalLine);
  Py_VISIT(P->VersionTriple);
  Py_VISIT(P->SetupMethod);
  Py_VISIT(P->AddTokenMethod);
  Py_VISIT(P->GetRootNodeMethod);
  return 0;
}

int parser_clear(PyObject *Self) {
  ParserObject *P = self(Self);
  Py_CLEAR(P->Grammar);
  Py_CLEAR(P->Keywords);
  Py_CLEAR(P->Parser);
  Py_CLEAR(P->Factory);
  Py_CLEAR(P->Logical);
  Py_CLEAR(P->ClsForStateList);
  Py_CLEAR(P->GetTime);
  Py_CLEAR(P->CLogicalLine);
  Py_CLEAR(P->VersionTriple);
  Py_CLEAR(P->SetupMethod);
  Py_CLEAR(P->AddTokenMethod);
  Py_CLEAR(P->GetRootNodeMethod);
  return 0;
}

PyObject *parser_ParseToNode(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<PyObject *>(nullptr, [&] {
    static const char *Keywords[] = {"logical", "in_async_def", nullptr};
    PyObject *Logical, *InAsyncDef;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "OO:ParseToNode", const_cast<char **>(Keywords), &Logical,
                                     &InAsyncDef))
      throw tl::PyErrSet();
    return parseToNode(self(Self), Logical, tl::isTrue(InAsyncDef)).release();
  });
}

PyObject *parser_ParseTokenListToNode(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<PyObject *>(nullptr, [&] {
    static const char *Keywords[] = {"tok_list", "in_async_def", nullptr};
    PyObject *TokList, *InAsyncDef;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "OO:ParseTokenListToNode", const_cast<char **>(Keywords),
                                     &TokList, &InAsyncDef))
      throw tl::PyErrSet();
    tl::expectType(PyList_Check(TokList), "list", TokList);
    return parseTokenListToNode(self(Self), TokList, tl::isTrue(InAsyncDef)).release();
  });
}

PyObject *parser_AddTokenList(PyObject *Self, PyObject *Args) {
  return tl::guard<PyObject *>(nullptr, [&] {
    PyObject *TokenList, *Context;
    if (!PyArg_ParseTuple(Args, "OO:_AddTokenList", &TokenList, &Context))
      throw tl::PyErrSet();
    requireReady(self(Self));
    addTokenList(self(Self), TokenList, Context);
    Py_RETURN_NONE;
  });
}

PyObject *parser_ShouldSkipSlash(PyObject *Self, PyObject *Arg) {
  return tl::guard<PyObject *>(nullptr, [&] {
    Py_ssize_t I = PyInt_AsSsize_t(Arg);
    if (I == -1 && PyErr_Occurred())
      throw tl::PyErrSet();
    return PyBool_FromLong(shouldSkipSlash(self(Self), I));
  });
}

PyObject *parser_DiscardNode(PyObject *Self, PyObject *Node) {
  return tl::guard<PyObject *>(nullptr, [&] {
    if (!isNode(Node))
      tl::raiseFormat(PyExc_TypeError, "Argument '%.200s' has incorrect type (expected %.200s, got %.200s)",
                      "node", cnodeType().tp_name, Py_TYPE(Node)->tp_name);
    discardNode(self(Self), Node);
    Py_RETURN_NONE;
  });
}

PyObject *parser_BuildClsForStateList(PyObject *Self, PyObject *) {
  return tl::guard<PyObject *>(nullptr, [&] {
    if (!self(Self)->Grammar)
      tl::raise(PyExc_ValueError, "CPGenParserImpl is not initialised");
    return buildClsForStateList(self(Self)).release();
  });
}

PyObject *parser_FreeNodeCount(PyObject *Self, PyObject *) {
  return tl::guard<PyObject *>(nullptr, [&] {
    requireReady(self(Self));
    return PyInt_FromSsize_t(factoryFreeNodeCount(self(Self)->Factory));
  });
}

PyMethodDef ParserMethods[] = {
    {"ParseToNode", tl::kwFunction(parser_ParseToNode), METH_VARARGS | METH_KEYWORDS,
     "ParseToNode(logical, in_async_def) -> CNode or None: the statement node of a logical line"},
    {"ParseTokenListToNode", tl::kwFunction(parser_ParseTokenListToNode),
     METH_VARARGS | METH_KEYWORDS,
     "ParseTokenListToNode(tok_list, in_async_def) -> CNode or None: the statement node of a list of "
     "token texts"},
    {"_AddTokenList", parser_AddTokenList, METH_VARARGS,
     "_AddTokenList(token_list, context): feeds token texts to the parser"},
    {"_ShouldSkipSlash", parser_ShouldSkipSlash, METH_O,
     "_ShouldSkipSlash(tok_i) -> bool: whether token tok_i is a backslash that continues the line"},
    {"DiscardNode", parser_DiscardNode, METH_O, "DiscardNode(node): returns a tree to the free lists"},
    {"_BuildClsForStateList", parser_BuildClsForStateList, METH_NOARGS,
     "_BuildClsForStateList() -> list: node class per grammar state number"},
    {"_FreeNodeCount", parser_FreeNodeCount, METH_NOARGS,
     "_FreeNodeCount() -> int: number of nodes on the factory's free lists"},
    {nullptr, nullptr, 0, nullptr}};

PyObject *parser_getVersionTriple(PyObject *Self, void *) {
  PyObject *V = self(Self)->VersionTriple ? self(Self)->VersionTriple : Py_None;
  Py_INCREF(V);
  return V;
}

PyObject *parser_getAsyncAlwaysKeyword(PyObject *Self, void *) {
  return PyBool_FromLong(self(Self)->AsyncAlwaysKeyword);
}

PyGetSetDef ParserGetSets[] = {
    {const_cast<char *>("_fVersionTriple"), parser_getVersionTriple, nullptr,
     const_cast<char *>("target language version"), nullptr},
    {const_cast<char *>("_fAsyncAlwaysKeyword"), parser_getAsyncAlwaysKeyword, nullptr,
     const_cast<char *>("whether async and await are always keywords"), nullptr},
    {nullptr, nullptr, nullptr, nullptr, nullptr}};

/// kClsForState before the classes' own rules are merged in.
void addClsForState() {
  static const std::pair<const char *, NodeClass> Initial[] = {
      {"NAME", NodeClass::CNameLiteral},
      {"STRING", NodeClass::CStringLiteral},
      {"NUMBER", NodeClass::CNumberLiteral},
      {"with_stmt", NodeClass::CWithStmt},
      {"with_item", NodeClass::CWithItem},
      {"pass_stmt", NodeClass::CPassStmt},
      {"expr_stmt", NodeClass::CExprStmt},
      {"return_stmt", NodeClass::CReturnStmt},
      {"power", NodeClass::CPower},
      {"trailer", NodeClass::CTrailer},
      {"atom", NodeClass::CAtom},
      {"funcdef", NodeClass::CFuncdefStmt},
      {"global_stmt", NodeClass::CGlobalStmt},
      {"nonlocal_stmt", NodeClass::CNonlocalStmt},
      {"lambdef", NodeClass::CLambdaExpr},
      {"lambdef_nocond", NodeClass::CLambdaExpr},
      {"parameters", NodeClass::CParametersNode},
      {"typedargslist", NodeClass::CDefiningArglistNode},
      {"varargslist", NodeClass::CDefiningArglistNode},
      {"arglist", NodeClass::CUsedArglistNode},
      {"argument", NodeClass::CSingleUsedArgumentNode},
      {"classdef", NodeClass::CClassdefStmt},
      {"for_stmt", NodeClass::CForStmt},
      {"import_name", NodeClass::CImportNamesStmt},
      {"import_from", NodeClass::CFromImportStmt},
      {"comp_for", NodeClass::CCompForNode},
      {"list_for", NodeClass::CCompForNode},
      {"factor", NodeClass::CFactorExpr},
  };
  Ref Dict = tl::require(PyDict_New());
  for (const auto &Entry : Initial)
    tl::requireStatus(PyDict_SetItemString(Dict.get(), Entry.first,
                                           reinterpret_cast<PyObject *>(&nodeType(Entry.second))));
  tl::requireStatus(PyDict_SetItemString(ParserType.tp_dict, "kClsForState", Dict.get()));
  PyType_Modified(&ParserType);
}

} // namespace

PyTypeObject &parserType() { return ParserType; }

Ref parseToNode(ParserObject *P, PyObject *Logical, bool InAsyncDef) {
  ParseScope Scope(P);
  requireReady(P);
  auto *L = host::requireLogicalArg(Logical, "logical");
  TokenSnapshot S;
  S.readLogical(L);
  Py_INCREF(Logical);
  Py_XSETREF(P->Logical, Logical);
  return parseLine(P, S, P->AsyncAlwaysKeyword || InAsyncDef);
}

Ref parseTokenListToNode(ParserObject *P, PyObject *TokList, bool InAsyncDef) {
  ParseScope Scope(P);
  requireReady(P);
  tl::expectType(PyList_Check(TokList), "list", TokList);
  TokenSnapshot S;
  S.readList(TokList);
  Py_CLEAR(P->Logical);
  return parseLine(P, S, InAsyncDef);
}

int initParserType(PyObject *Module) {
  return tl::guard<int>(-1, [&] {
    Synth.If = makeSynth("if");
    Synth.Zero = makeSynth("0");
    Synth.Colon = makeSynth(":");
    Synth.Equal = makeSynth("=");
    Synth.Pass = makeSynth("pass");
    Synth.Newline = makeSynth("\n");
    Synth.Try = makeSynth("try");
    Synth.Finally = makeSynth("finally");
    Synth.Def = makeSynth("def");
    Synth.Function = makeSynth("function");
    Synth.LPar = makeSynth("(");
    Synth.RPar = makeSynth(")");
    Synth.Dot = makeSynth(".");
    Synth.Elif = tl::internName("elif");
    Synth.Except = tl::internName("except");
    Synth.Else = tl::internName("else");
    Synth.Async = tl::internName("async");
    Synth.Await = tl::internName("await");
    Synth.InvalidSyntax = tl::internName("invalid syntax");
    Synth.With = tl::internName("with");
    Synth.As = tl::internName("as");
    Synth.Type = tl::internName("type");
    Synth.Match = SynthToken{tl::internName("match"), kMatch};
    Synth.Case = SynthToken{tl::internName("case"), kCase};

    tl::TypeDesc D;
    D.Name = "pysource.treelens.CPGenParserImpl";
    D.Doc = "Analyzes logical using a parser implemented via the pgen2 package";
    D.Size = sizeof(ParserObject);
    D.Base = &analyzerBaseType();
    D.Flags = Py_TPFLAGS_DEFAULT;
    D.Methods = ParserMethods;
    D.GetSets = ParserGetSets;
    D.Dealloc = tl::gcDealloc<parser_clear>;
    D.Traverse = parser_traverse;
    D.Clear = parser_clear;
    D.Init = parser_init;
    D.New = parser_new;
    tl::requireStatus(tl::readyType(ParserType, D));
    addClsForState();
    tl::requireStatus(tl::addType(Module, "CPGenParserImpl", ParserType));
    using F = tl::FieldKind;
    tl::registerPickle(ParserType,
                       {{"_fGrammar", F::Object, offsetof(ParserObject, Grammar)},
                        {"_fPy3Grammar", F::Bool, offsetof(ParserObject, Py3Grammar)},
                        {"_fFileInputNumber", F::Int, offsetof(ParserObject, FileInputNumber)},
                        {"_fKeywords", F::Object, offsetof(ParserObject, Keywords), &PyDict_Type},
                        {"_fParser", F::Object, offsetof(ParserObject, Parser)},
                        {"_fNodeFactory", F::Object, offsetof(ParserObject, Factory), &factoryType()},
                        {"_fLogical", F::Object, offsetof(ParserObject, Logical)},
                        {"_fClsForStateList", F::Object, offsetof(ParserObject, ClsForStateList), &PyList_Type},
                        {"__GetTime", F::Object, offsetof(ParserObject, GetTime)},
                        {"__CLogicalLine", F::Object, offsetof(ParserObject, CLogicalLine)},
                        {"_fVersionTriple", F::Object, offsetof(ParserObject, VersionTriple), &PyTuple_Type},
                        {"_fAsyncAlwaysKeyword", F::Bool, offsetof(ParserObject, AsyncAlwaysKeyword)}},
                       Host.UnpickleFields, beforeSetState);
    return 0;
  });
}

} // namespace treelens
