// The Parser type. The engine reports pushes, shifts and pops; this file
// turns them into converter calls and children lists.
#include "parser.h"

#include "converter.h"
#include "messages.h"
#include "native/common/typedesc.h"
#include "pgen/parser.h"
#include "tables.h"

#include <memory>
#include <new>
#include <vector>

namespace optpgen {

PyTypeObject ParserType;
PyObject *ParseErrorType = nullptr;

namespace {

using tl::guard;
using tl::Ref;
using tl::require;

/// A nonterminal being built: owns Context; its children are the nodes of
/// the child stack from FirstChild on.
struct NodeFrame {
  int Type;
  PyObject *Context;
  size_t FirstChild;
};

/// The nonterminals being built, parallel to the engine's stack (which
/// never holds more than its MaxDepth).
class FrameStack {
public:
  explicit FrameStack(size_t Capacity) : Frames(new NodeFrame[Capacity]) {}
  bool empty() const { return Size == 0; }
  NodeFrame &back() { return Frames[Size - 1]; }
  void push_back(const NodeFrame &F) { Frames[Size++] = F; }
  void pop_back() { --Size; }
  const NodeFrame *begin() const { return &Frames[0]; }
  const NodeFrame *end() const { return &Frames[Size]; }

private:
  std::unique_ptr<NodeFrame[]> Frames;
  size_t Size = 0;
};

/// Parser state; the engine's sink.
class ParserImpl {
public:
  ParserImpl(GrammarPtr T, PyObject *G, PyObject *C, bool Promote,
             size_t MaxDepth)
      : Tables(std::move(T)), Grammar(G), Converter(C), Promote(Promote),
        Raw(C == nullptr), Frames(MaxDepth), Driver(*Tables, *this, MaxDepth) {
    Py_INCREF(Grammar);
    Py_XINCREF(Converter);
    Native = Raw ? nullptr : nativeConvertOf(Converter);
    Children.reserve(64);
  }
  ~ParserImpl() { clear(); }

  /// Drops partial trees, the root and the held objects (tp_clear).
  void clear() {
    Driver.reset();
    clearTree();
    Py_CLEAR(Converter);
    Py_CLEAR(Grammar);
  }

  /// Drops partial trees and the root. Releasing them can run Python code,
  /// so callers hold the busy mark.
  void clearTree() {
    while (!Frames.empty()) {
      PyObject *Ctx = Frames.back().Context;
      Frames.pop_back();
      Py_DECREF(Ctx);
    }
    while (!Children.empty()) {
      PyObject *Node = Children.back();
      Children.pop_back();
      Py_DECREF(Node);
    }
    Py_CLEAR(Root);
  }

  int traverse(visitproc visit, void *arg) {
    Py_VISIT(Grammar);
    Py_VISIT(Converter);
    Py_VISIT(Root);
    for (const NodeFrame &F : Frames)
      Py_VISIT(F.Context);
    for (PyObject *Node : Children)
      Py_VISIT(Node);
    return 0;
  }

  // Engine sink. The current token is in TypeObj, Type, Value, Context.

  bool push(int Symbol) {
    Py_INCREF(Context);
    Frames.push_back(NodeFrame{Symbol, Context, Children.size()});
    return true;
  }

  bool shift() {
    return adopt(convert(TypeObj, Type, Value, Context, Py_None));
  }

  bool pop(int Symbol) {
    NodeFrame F = Frames.back();
    Frames.pop_back();
    Ref Ctx = Ref::steal(F.Context);
    size_t N = Children.size() - F.FirstChild;
    if (Promote && N == 1) {
      // The only child stays where it is, now a child of the parent.
      if (Frames.empty()) {
        PyObject *Only = Children.back();
        Children.pop_back();
        return adopt(Only);
      }
      return true;
    }
    Ref Kids = Ref::steal(PyList_New(static_cast<Py_ssize_t>(N)));
    if (!Kids)
      return false;
    for (size_t I = 0; I < N; ++I)
      PyList_SET_ITEM(Kids.get(), I, Children[F.FirstChild + I]);
    Children.resize(F.FirstChild);
    Ref SymbolObj;
    if (!Native) {
      SymbolObj = Ref::steal(PyInt_FromLong(Symbol));
      if (!SymbolObj)
        return false;
    }
    return adopt(convert(SymbolObj.get(), Symbol, Py_None, Ctx.get(),
                         Kids.get()));
  }

  GrammarPtr Tables;
  PyObject *Grammar;              ///< owned; null once cleared
  PyObject *Converter;            ///< owned; null for raw tuples
  PyObject *Root = nullptr;       ///< owned; the converted start symbol
  bool Promote;                   ///< one-child nonterminals are not built
  bool Raw;                       ///< no converter: (type, value, context, children)
  bool Busy = false;              ///< inside addtoken, setup or a release
  ConvertFunc Native = nullptr;   ///< set when the converter's slot is used
  FrameStack Frames;
  std::vector<PyObject *> Children; ///< owned; see NodeFrame
  pgen::Parser<ParserImpl> Driver;

  // The token being added; borrowed for the duration of addtoken.
  PyObject *TypeObj = nullptr;
  PyObject *Value = nullptr;
  PyObject *Context = nullptr;
  int Type = 0;

private:
  /// New reference to the converted node, Py_None to drop it, null on error.
  PyObject *convert(PyObject *TypeO, int T, PyObject *V, PyObject *Ctx,
                    PyObject *Kids) {
    if (Native)
      return Native(Converter, Grammar, T, V, Ctx, Kids);
    if (Raw)
      return PyTuple_Pack(4, TypeO, V, Ctx, Kids);
    return PyObject_CallMethodObjArgs(Converter, ConvertName, Grammar, TypeO,
                                      V, Ctx, Kids, nullptr);
  }

  /// Adds a converted node (stolen; null: failure) to the innermost
  /// nonterminal, or makes it the root.
  bool adopt(PyObject *Node) {
    if (!Node)
      return false;
    if (Node == Py_None) {
      Py_DECREF(Node);
      return true;
    }
    if (Frames.empty()) {
      PyObject *Old = Root;
      Root = Node;
      Py_XDECREF(Old);
      return true;
    }
    try {
      Children.push_back(Node);
    } catch (const std::bad_alloc &) {
      Py_DECREF(Node);
      PyErr_NoMemory();
      return false;
    }
    return true;
  }
};

struct ParserObject {
  PyObject_HEAD
  ParserImpl *Impl;
  PyObject *WeakRefs;
};

ParserImpl &impl(PyObject *Self) {
  return *reinterpret_cast<ParserObject *>(Self)->Impl;
}

/// Holds the busy mark; refuses re-entry from convert or a finaliser.
class BusyScope {
public:
  explicit BusyScope(ParserImpl &P) : P(P) {
    if (P.Busy)
      tl::raise(PyExc_RuntimeError, msg::Busy);
    P.Busy = true;
  }
  ~BusyScope() { P.Busy = false; }

private:
  ParserImpl &P;
};

/// Token type of an int object; -1 (no label) for anything else.
int tokenType(PyObject *O) {
  long V = -1;
  if (PyInt_Check(O)) {
    V = PyInt_AS_LONG(O);
  } else if (PyLong_Check(O)) {
    int Overflow = 0;
    V = PyLong_AsLongAndOverflow(O, &Overflow);
    if (Overflow)
      V = -1;
  }
  return V >= 0 && V < 256 ? static_cast<int>(V) : -1;
}

[[noreturn]] void raiseParseError(const char *Msg, PyObject *TypeObj,
                                  PyObject *Value, PyObject *Context) {
  Ref M = require(PyString_FromString(Msg));
  Ref E = require(PyObject_CallFunctionObjArgs(ParseErrorType, M.get(),
                                               TypeObj, Value, Context,
                                               nullptr));
  PyErr_SetObject(ParseErrorType, E.get());
  throw tl::PyErrSet();
}

const char *statusMessage(pgen::Status S) {
  switch (S) {
  case pgen::Status::BadInput:
    return msg::BadInput;
  case pgen::Status::BadToken:
    return msg::BadToken;
  case pgen::Status::TooMuchInput:
    return msg::TooMuchInput;
  case pgen::Status::TooDeep:
    return msg::TooDeep;
  case pgen::Status::NoProgress:
    return msg::NoProgress;
  default:
    return nullptr;
  }
}

/// Adds one token: Py_True or Py_False (new reference); throws PyErrSet.
/// All arguments borrowed.
PyObject *addToken(PyObject *Self, PyObject *TypeObj, PyObject *Value,
                   PyObject *Context) {
  ParserImpl &P = impl(Self);
  const char *Text = nullptr;
  Py_ssize_t Len = 0;
  Ref Utf8;
  if (PyString_Check(Value)) {
    Text = PyString_AS_STRING(Value);
    Len = PyString_GET_SIZE(Value);
  } else if (PyUnicode_Check(Value)) {
    Utf8 = Ref::steal(PyUnicode_AsUTF8String(Value));
    if (Utf8) {
      Text = PyString_AS_STRING(Utf8.get());
      Len = PyString_GET_SIZE(Utf8.get());
    } else {
      PyErr_Clear(); // not encodable: no keyword
    }
  }

  pgen::Status S;
  {
    BusyScope Busy(P);
    P.TypeObj = TypeObj;
    P.Type = tokenType(TypeObj);
    P.Value = Value;
    P.Context = Context;
    S = P.Driver.addToken(P.Type, Text, static_cast<size_t>(Len));
    if (S == pgen::Status::Ok)
      Py_RETURN_FALSE;
    if (S == pgen::Status::Done)
      Py_RETURN_TRUE;
    if (S == pgen::Status::NotReady)
      tl::raise(PyExc_RuntimeError, msg::NotReady);
    // Release the partial trees now; keep a convert error across it.
    PyObject *ET, *EV, *ETb;
    PyErr_Fetch(&ET, &EV, &ETb);
    P.clearTree();
    PyErr_Restore(ET, EV, ETb);
  }
  if (const char *M = statusMessage(S))
    raiseParseError(M, TypeObj, Value, Context);
  if (!PyErr_Occurred())
    PyErr_SetString(PyExc_SystemError, "convert failed without an error");
  throw tl::PyErrSet();
}

PyObject *parser_addtoken(PyObject *Self, PyObject *Args, PyObject *Kw) {
  return guard<PyObject *>(nullptr, [&]() -> PyObject * {
    PyObject *TypeObj, *Value, *Context;
    static const char *Names[] = {"type", "value", "context", nullptr};
    if (!Kw && PyTuple_GET_SIZE(Args) == 3) {
      TypeObj = PyTuple_GET_ITEM(Args, 0);
      Value = PyTuple_GET_ITEM(Args, 1);
      Context = PyTuple_GET_ITEM(Args, 2);
    } else if (!PyArg_ParseTupleAndKeywords(Args, Kw, "OOO:addtoken",
                                            const_cast<char **>(Names),
                                            &TypeObj, &Value, &Context)) {
      throw tl::PyErrSet();
    }
    return addToken(Self, TypeObj, Value, Context);
  });
}

/// Starts a new input at Symbol (the grammar's start when None); throws
/// PyErrSet.
void setupParser(PyObject *Self, PyObject *Start) {
  ParserImpl &P = impl(Self);
  if (!P.Grammar)
    tl::raise(PyExc_RuntimeError, msg::NotReady);
  long Symbol = P.Tables->startSymbol();
  if (Start != Py_None) {
    Symbol = PyInt_AsLong(Start);
    if (Symbol == -1 && PyErr_Occurred())
      throw tl::PyErrSet();
  }
  BusyScope Busy(P);
  // Whatever follows fails or succeeds, the previous input is gone.
  P.Driver.reset();
  P.clearTree();
  P.Native = P.Raw ? nullptr : nativeConvertOf(P.Converter);
  if (Symbol < pgen::FirstSymbol || Symbol > 0x7fffffffL ||
      !P.Driver.setup(static_cast<int>(Symbol)))
    tl::raiseFormat(PyExc_ValueError, msg::UnknownStart, Symbol);
  Py_INCREF(Py_None);
  P.Frames.push_back(NodeFrame{static_cast<int>(Symbol), Py_None, 0});
}

PyObject *parser_setup(PyObject *Self, PyObject *Args, PyObject *Kw) {
  return guard<PyObject *>(nullptr, [&]() -> PyObject * {
    PyObject *Start = Py_None;
    static const char *Names[] = {"start", nullptr};
    if (!PyArg_ParseTupleAndKeywords(Args, Kw, "|O:setup",
                                     const_cast<char **>(Names), &Start))
      throw tl::PyErrSet();
    setupParser(Self, Start);
    Py_RETURN_NONE;
  });
}

PyObject *parser_getrootnode(PyObject *Self, PyObject *) {
  PyObject *Root = impl(Self).Root;
  if (!Root)
    Root = Py_None;
  Py_INCREF(Root);
  return Root;
}

PyObject *getObject(PyObject *O) {
  if (!O)
    O = Py_None;
  Py_INCREF(O);
  return O;
}

PyObject *parser_get_grammar(PyObject *Self, void *) {
  return getObject(impl(Self).Grammar);
}
PyObject *parser_get_converter(PyObject *Self, void *) {
  return getObject(impl(Self).Converter);
}
PyObject *parser_get_rootnode(PyObject *Self, void *) {
  return getObject(impl(Self).Root);
}
PyObject *parser_get_promote(PyObject *Self, void *) {
  return PyBool_FromLong(impl(Self).Promote);
}
PyObject *parser_get_usesnative(PyObject *Self, void *) {
  return PyBool_FromLong(impl(Self).Native != nullptr);
}
PyObject *parser_get_maxdepth(PyObject *Self, void *) {
  return PyInt_FromSize_t(impl(Self).Driver.MaxDepth);
}

/// The maxdepth argument: an int in 1..MaxParseDepthLimit.
size_t maxDepthArg(PyObject *O) {
  tl::expectType(PyInt_Check(O) || PyLong_Check(O), "int", O);
  long V = PyInt_AsLong(O);
  if (V == -1 && PyErr_Occurred()) {
    if (!PyErr_ExceptionMatches(PyExc_OverflowError))
      throw tl::PyErrSet();
    PyErr_Clear();
  }
  if (V < 1 || static_cast<unsigned long>(V) > pgen::MaxParseDepthLimit)
    tl::raiseFormat(PyExc_ValueError, msg::BadMaxDepth,
                    static_cast<long>(pgen::MaxParseDepthLimit));
  return static_cast<size_t>(V);
}

PyObject *parser_new(PyTypeObject *Type, PyObject *Args, PyObject *Kw) {
  return guard<PyObject *>(nullptr, [&] {
    PyObject *Grammar, *Converter = Py_None, *PromoteObj = Py_False;
    PyObject *DepthObj = nullptr;
    static const char *Names[] = {"grammar", "converter", "promotesinglechild",
                                  "maxdepth", nullptr};
    if (!PyArg_ParseTupleAndKeywords(Args, Kw, "O|OOO:Parser",
                                     const_cast<char **>(Names), &Grammar,
                                     &Converter, &PromoteObj, &DepthObj))
      throw tl::PyErrSet();
    bool Promote = tl::requireStatus(PyObject_IsTrue(PromoteObj)) != 0;
    size_t MaxDepth = DepthObj && DepthObj != Py_None ? maxDepthArg(DepthObj)
                                                      : pgen::MaxParseDepth;
    if (Converter == Py_None)
      Converter = nullptr;
    else if (!PyObject_TypeCheck(Converter, &NodeConverterType) &&
             !PyObject_HasAttr(Converter, ConvertName))
      tl::expectType(false, "a converter", Converter);
    GrammarPtr Tables = tablesFor(Grammar);
    Ref Self = require(Type->tp_alloc(Type, 0));
    auto *O = reinterpret_cast<ParserObject *>(Self.get());
    O->Impl = new ParserImpl(std::move(Tables), Grammar, Converter, Promote,
                             MaxDepth);
    return Self.release();
  });
}

int parser_traverse(PyObject *Self, visitproc Visit, void *Arg) {
  ParserImpl *P = reinterpret_cast<ParserObject *>(Self)->Impl;
  return P ? P->traverse(Visit, Arg) : 0;
}

int parser_clear(PyObject *Self) {
  if (ParserImpl *P = reinterpret_cast<ParserObject *>(Self)->Impl)
    P->clear();
  return 0;
}

void parser_dealloc(PyObject *Self) {
  auto *O = reinterpret_cast<ParserObject *>(Self);
  PyObject_GC_UnTrack(Self);
  if (O->WeakRefs)
    PyObject_ClearWeakRefs(Self);
  delete O->Impl;
  O->Impl = nullptr;
  Py_TYPE(Self)->tp_free(Self);
}

PyMethodDef ParserMethods[] = {
    {"setup", optpgen::kwMethod(parser_setup),
     METH_VARARGS | METH_KEYWORDS,
     "setup(start=None)\n\nStarts a new input at the start symbol (default: "
     "the grammar's); drops the previous tree."},
    {"addtoken", optpgen::kwMethod(parser_addtoken),
     METH_VARARGS | METH_KEYWORDS,
     "addtoken(type, value, context) -> bool\n\nAdds a token; True when the "
     "start symbol is complete. Raises ParseError for a token the grammar "
     "does not accept."},
    {"getrootnode", parser_getrootnode, METH_NOARGS,
     "getrootnode() -> the converted start symbol, or None"},
    {nullptr, nullptr, 0, nullptr}};

PyGetSetDef ParserGetSets[] = {
    {const_cast<char *>("grammar"), parser_get_grammar, nullptr,
     const_cast<char *>("the grammar object"), nullptr},
    {const_cast<char *>("converter"), parser_get_converter, nullptr,
     const_cast<char *>("the converter, or None for raw tuples"), nullptr},
    {const_cast<char *>("rootnode"), parser_get_rootnode, nullptr,
     const_cast<char *>("same as getrootnode()"), nullptr},
    {const_cast<char *>("promotesinglechild"), parser_get_promote, nullptr,
     const_cast<char *>("nonterminals with one child are replaced by it"),
     nullptr},
    {const_cast<char *>("maxdepth"), parser_get_maxdepth, nullptr,
     const_cast<char *>("the most nonterminals open at once"), nullptr},
    {const_cast<char *>("_usesnative"), parser_get_usesnative, nullptr,
     const_cast<char *>("the converter's native slot is called directly"),
     nullptr},
    {nullptr, nullptr, nullptr, nullptr, nullptr}};

} // namespace

namespace {

/// Starts loading the cache line at P.
inline void prefetch(const void *P) {
#if defined(__GNUC__) && (defined(__x86_64__) || defined(__i386__))
  __asm__ volatile("prefetcht0 %0" : : "m"(*static_cast<const char *>(P)));
#else
  (void)P;
#endif
}

/// Token tuples and their objects are scattered over the heap. The feed
/// keeps the tuples TupleAhead tokens ahead and the values and contexts of
/// those ItemsAhead tokens ahead (their tuples fetched earlier) loading while
/// it parses, and starts with the whole first window, as most lines are
/// short.
constexpr Py_ssize_t TupleAhead = 8, ItemsAhead = 4;

inline void prefetchItems(PyObject *T) {
  if (PyTuple_CheckExact(T) && PyTuple_GET_SIZE(T) == 3) {
    prefetch(PyTuple_GET_ITEM(T, 1));
    prefetch(PyTuple_GET_ITEM(T, 2));
  }
}

inline void prefetchFirst(PyObject **Items, Py_ssize_t N) {
  for (Py_ssize_t I = 0; I < N && I < TupleAhead; ++I)
    prefetch(Items[I]);
  for (Py_ssize_t I = 0; I < N && I < ItemsAhead; ++I)
    prefetchItems(Items[I]);
}

inline void prefetchNext(PyObject **Items, Py_ssize_t I, Py_ssize_t N) {
  if (I + TupleAhead < N)
    prefetch(Items[I + TupleAhead]);
  if (I + ItemsAhead < N)
    prefetchItems(Items[I + ItemsAhead]);
}

} // namespace

PyObject *feedTokens(PyObject *, PyObject *Args) {
  return guard<PyObject *>(nullptr, [&]() -> PyObject * {
    PyObject *Self, *Tokens;
    if (PyTuple_GET_SIZE(Args) == 2 &&
        Py_TYPE(PyTuple_GET_ITEM(Args, 0)) == &ParserType) {
      Self = PyTuple_GET_ITEM(Args, 0);
      Tokens = PyTuple_GET_ITEM(Args, 1);
    } else if (!PyArg_ParseTuple(Args, "O!O:_FeedTokens", &ParserType, &Self,
                                 &Tokens)) {
      throw tl::PyErrSet();
    }
    Ref Seq = require(PySequence_Fast(Tokens, "tokens must be a sequence"));
    setupParser(Self, Py_None);
    Ref Result = Ref::borrow(Py_False);
    prefetchFirst(PySequence_Fast_ITEMS(Seq.get()),
                  PySequence_Fast_GET_SIZE(Seq.get()));
    // A converter may change a list while it is fed (as a for loop over it
    // would see): the size and the item array are read again after each
    // token, and the token tuple is held while it is added.
    for (Py_ssize_t I = 0; I < PySequence_Fast_GET_SIZE(Seq.get()); ++I) {
      PyObject **Items = PySequence_Fast_ITEMS(Seq.get());
      prefetchNext(Items, I, PySequence_Fast_GET_SIZE(Seq.get()));
      Ref T = Ref::borrow(Items[I]);
      if (!PyTuple_Check(T.get()) || PyTuple_GET_SIZE(T.get()) != 3)
        tl::expectType(false, "a (type, value, context) tuple", T.get());
      Result = require(addToken(Self, PyTuple_GET_ITEM(T.get(), 0),
                                PyTuple_GET_ITEM(T.get(), 1),
                                PyTuple_GET_ITEM(T.get(), 2)));
      if (Result.get() == Py_True)
        break;
    }
    return Result.release();
  });
}

PyObject *createParser(PyObject *, PyObject *Args, PyObject *Kw) {
  return guard<PyObject *>(nullptr, [&] {
    PyObject *Grammar, *Converter, *Promote = Py_False, *MaxDepth = Py_None;
    static const char *Names[] = {"grammar", "converter", "promotesinglechild",
                                  "maxdepth", nullptr};
    if (!PyArg_ParseTupleAndKeywords(Args, Kw, "OO|OO:CreateParser",
                                     const_cast<char **>(Names), &Grammar,
                                     &Converter, &Promote, &MaxDepth))
      throw tl::PyErrSet();
    Ref CallArgs =
        require(PyTuple_Pack(4, Grammar, Converter, Promote, MaxDepth));
    return parser_new(&ParserType, CallArgs.get(), nullptr);
  });
}

namespace {

void expectParser(PyObject *O) {
  tl::expectType(PyObject_TypeCheck(O, &ParserType), "Parser", O);
}

int apiSetup(PyObject *Self, int Start) {
  return guard(-1, [&] {
    expectParser(Self);
    Ref StartObj = require(PyInt_FromLong(Start));
    setupParser(Self, StartObj.get());
    return 0;
  });
}

int apiAddToken(PyObject *Self, int Type, PyObject *Value, PyObject *Context) {
  return guard(-1, [&] {
    expectParser(Self);
    Ref TypeObj = require(PyInt_FromLong(Type));
    Ref Result = require(addToken(Self, TypeObj.get(), Value, Context));
    return Result.get() == Py_True ? 1 : 0;
  });
}

PyObject *apiGetRootNode(PyObject *Self) {
  return guard<PyObject *>(nullptr, [&] {
    expectParser(Self);
    return parser_getrootnode(Self, nullptr);
  });
}

} // namespace

const ParserApi *parserApi() {
  static ParserApi Api = {kParserApiVersion, &ParserType, &NodeConverterType,
                          nullptr,           apiSetup,    apiAddToken,
                          apiGetRootNode};
  Api.ParseError = ParseErrorType;
  return &Api;
}

int initParser(PyObject *Module) {
  tl::TypeDesc D;
  D.Name = "pysource.optpgen.Parser";
  D.Doc = "Parser(grammar, converter=None, promotesinglechild=False, "
          "maxdepth=kMaxDepth)\n\n"
          "LL(1) parser over a pgen grammar object. Call setup(), then "
          "addtoken() for each token until it returns True, then "
          "getrootnode(). Without a converter nodes are (type, value, "
          "context, children) tuples. At most maxdepth nonterminals (1 to "
          "kMaxDepthLimit) may be open at once.";
  D.Size = sizeof(ParserObject);
  D.Flags = Py_TPFLAGS_DEFAULT;
  D.Methods = ParserMethods;
  D.GetSets = ParserGetSets;
  D.New = parser_new;
  D.Dealloc = parser_dealloc;
  D.Traverse = parser_traverse;
  D.Clear = parser_clear;
  D.WeakListOffset = offsetof(ParserObject, WeakRefs);
  if (tl::readyType(ParserType, D) < 0)
    return -1;
  if (PyModule_AddIntConstant(Module, "kMaxDepth", pgen::MaxParseDepth) < 0 ||
      PyModule_AddIntConstant(Module, "kMaxDepthLimit",
                              pgen::MaxParseDepthLimit) < 0)
    return -1;
  return tl::addType(Module, "Parser", ParserType);
}

} // namespace optpgen
