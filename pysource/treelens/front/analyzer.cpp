// CPGenAnalyzer and CPGenAnalyzerImpl: one logical line from the host to its recorded results.
#include "pysource/treelens/front/front.h"

#include "fieldpickle.h"
#include "pysource/treelens/checks/checks.h"
#include "pysource/treelens/fstrings/fstrings.h"
#include "pysource/treelens/hints/hints.h"
#include "pysource/treelens/host/host.h"
#include "pysource/treelens/walker/walker.h"

#include <string>

namespace treelens {

using host::Host;
using tl::Ref;

namespace {

PyTypeObject AnalyzerBaseType;
PyTypeObject AnalyzerType;

/// kPy3DefaultGrammar as it was when the class was defined.
PyObject *DefaultGrammar;
PyObject *InvalidSyntax;

AnalyzerObject *self(PyObject *O) { return reinterpret_cast<AnalyzerObject *>(O); }

/// The pending exception, normalized; restores it on request.
struct FetchedError {
  PyObject *Type = nullptr, *Value = nullptr, *Traceback = nullptr;
  FetchedError() {
    PyErr_Fetch(&Type, &Value, &Traceback);
    PyErr_NormalizeException(&Type, &Value, &Traceback);
  }
  FetchedError(const FetchedError &) = delete;
  ~FetchedError() {
    Py_XDECREF(Type);
    Py_XDECREF(Value);
    Py_XDECREF(Traceback);
  }
  void restore() {
    PyErr_Restore(Type, Value, Traceback);
    Type = Value = Traceback = nullptr;
  }
  PyObject *value() const { return Value ? Value : Py_None; }
};

/// Calls reflect.ReportCurrentException(suppress_gui=True) with E as the
/// exception being handled (what sys.exc_info() returns meanwhile).
void reportException(FetchedError &E) {
  PyThreadState *TS = PyThreadState_GET();
  PyObject *SavedType = TS->exc_type, *SavedValue = TS->exc_value, *SavedTb = TS->exc_traceback;
  Py_XINCREF(E.Type);
  Py_XINCREF(E.Value);
  Py_XINCREF(E.Traceback);
  TS->exc_type = E.Type;
  TS->exc_value = E.Value;
  TS->exc_traceback = E.Traceback;
  PyObject *Func = PyObject_GetAttrString(Host.Reflect, "ReportCurrentException");
  PyObject *Result = nullptr;
  if (Func) {
    PyObject *Args = PyTuple_New(0);
    PyObject *Kwds = Py_BuildValue("{sO}", "suppress_gui", Py_True);
    if (Args && Kwds)
      Result = PyObject_Call(Func, Args, Kwds);
    Py_XDECREF(Args);
    Py_XDECREF(Kwds);
  }
  if (!Result)
    PyErr_WriteUnraisable(Func ? Func : Py_None);
  Py_XDECREF(Result);
  Py_XDECREF(Func);
  PyObject *SetType = TS->exc_type, *SetValue = TS->exc_value, *SetTb = TS->exc_traceback;
  TS->exc_type = SavedType;
  TS->exc_value = SavedValue;
  TS->exc_traceback = SavedTb;
  Py_XDECREF(SetType);
  Py_XDECREF(SetValue);
  Py_XDECREF(SetTb);
}

/// Clears the logical's derived info; a failure here is reported as unraisable.
void clearQuietly(PyObject *Logical) {
  if (Host.Fast->ClearDerivedInfo(Logical) < 0)
    PyErr_WriteUnraisable(Host.ClearLogicalDerivedInfo);
}

/// The logical's token texts joined by single blanks.
std::string joinedTokens(PyObject *Logical) {
  auto *L = reinterpret_cast<host::LogicalLineObject *>(Logical);
  std::string Out;
  for (Py_ssize_t I = 0; I < L->TokenCount; ++I) {
    if (I)
      Out += ' ';
    PyObject *T = L->Texts[I];
    if (T && PyString_Check(T))
      Out.append(PyString_AS_STRING(T), PyString_GET_SIZE(T));
    else
      Out += "None";
  }
  return Out;
}

/// Replaces the pending exception by the ValueError that names it and the
/// logical's tokens, keeping its traceback.
void wrapInValueError(PyObject *Logical) {
  FetchedError Inner;
  Ref Repr = Ref::steal(PyObject_Repr(Inner.value()));
  if (!Repr) {
    Inner.restore();
    return;
  }
  std::string Tokens = joinedTokens(Logical);
  Ref Message = Ref::steal(PyString_FromFormat(
      "Could not analyze logical -- inner exception is %s\n  logical tokens: %s",
      PyString_AsString(Repr.get()), Tokens.c_str()));
  Ref Error = Message ? Ref::steal(PyObject_CallFunctionObjArgs(PyExc_ValueError, Message.get(), nullptr))
                      : Ref();
  if (!Error) {
    Inner.restore();
    return;
  }
  Py_XINCREF(Inner.Traceback);
  Py_INCREF(PyExc_ValueError);
  PyErr_Restore(PyExc_ValueError, Error.release(), Inner.Traceback);
}

/// Returns Tree to the parser's free lists, keeping any pending exception.
void discardTree(AnalyzerObject *A, PyObject *Tree) {
  if (Tree == Py_None)
    return;
  PyObject *Type, *Value, *Tb;
  PyErr_Fetch(&Type, &Value, &Tb);
  if (!tl::guard<bool>(false, [&] {
        discardNode(A->LogicalParser, Tree);
        return true;
      }))
    PyErr_WriteUnraisable(Tree);
  PyErr_Restore(Type, Value, Tb);
}

void requireReady(AnalyzerObject *A) {
  if (!A->LogicalParser)
    tl::raise(PyExc_ValueError, "CPGenAnalyzerImpl is not initialised");
}

// ---- CPGenAnalyzer ----

PyObject *base_AnalyzeSingleLogical(PyObject *, PyObject *, PyObject *) {
  PyErr_SetNone(PyExc_NotImplementedError);
  return nullptr;
}

PyMethodDef AnalyzerBaseMethods[] = {
    {"AnalyzeSingleLogical", tl::kwFunction(base_AnalyzeSingleLogical),
     METH_VARARGS | METH_KEYWORDS,
     "AnalyzeSingleLogical(logical, in_async_def) -> None or the exception describing why analysis failed"},
    {nullptr, nullptr, 0, nullptr}};

// ---- CPGenAnalyzerImpl ----

PyObject *analyzer_new(PyTypeObject *Type, PyObject *, PyObject *) {
  return tl::guard<PyObject *>(nullptr, [&] {
    Ref Empty = tl::require(PyTuple_New(0));
    return tl::require(Host.NodeConverterType->tp_new(Type, Empty.get(), nullptr)).release();
  });
}

int analyzer_init(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<int>(-1, [&] {
    static const char *Keywords[] = {"version_triple", "grammar_file", "keyword_seq", "py3_grammar",
                                     "hint_grammar_file", "syntax_checks", nullptr};
    PyObject *VersionTriple, *GrammarFile = DefaultGrammar, *KeywordSeq = Py_None, *Py3Grammar = Py_True,
                             *HintGrammarFile = DefaultGrammar, *SyntaxChecks = Py_False;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "O|OOOOO:CPGenAnalyzerImpl", const_cast<char **>(Keywords),
                                     &VersionTriple, &GrammarFile, &KeywordSeq, &Py3Grammar,
                                     &HintGrammarFile, &SyntaxChecks))
      throw tl::PyErrSet();
    bool Checks = tl::requireStatus(PyObject_IsTrue(SyntaxChecks)) != 0;
    AnalyzerObject *A = self(Self);
    Ref Parser = tl::require(PyObject_CallFunctionObjArgs(reinterpret_cast<PyObject *>(&parserType()),
                                                          VersionTriple, GrammarFile, KeywordSeq, Py3Grammar,
                                                          nullptr));
    Py_XSETREF(A->LogicalParser, reinterpret_cast<ParserObject *>(Parser.release()));
    Py_XSETREF(A->NodeWalker, tl::require(PyObject_CallFunctionObjArgs(
                                              reinterpret_cast<PyObject *>(&walker::nodeWalkerType()), nullptr))
                                  .release());
    Py_XSETREF(A->TypeHintWalker,
               tl::require(PyObject_CallFunctionObjArgs(reinterpret_cast<PyObject *>(&hints::typeHintWalkerType()),
                                                        VersionTriple, HintGrammarFile, nullptr))
                   .release());
    Py_XSETREF(A->FStringSupport,
               tl::require(PyObject_CallFunctionObjArgs(
                               reinterpret_cast<PyObject *>(&fstrings::fstringSupportType()), nullptr))
                   .release());
    Py_INCREF(Host.TimeTime);
    Py_XSETREF(A->GetTime, Host.TimeTime);
    A->SyntaxChecks = Checks;
    return 0;
  });
}

int analyzer_traverse(PyObject *Self, visitproc visit, void *arg) {
  AnalyzerObject *A = self(Self);
  Py_VISIT(A->LogicalParser);
  Py_VISIT(A->GetTime);
  Py_VISIT(A->NodeWalker);
  Py_VISIT(A->TypeHintWalker);
  Py_VISIT(A->FStringSupport);
  return 0;
}

int analyzer_clear(PyObject *Self) {
  AnalyzerObject *A = self(Self);
  Py_CLEAR(A->LogicalParser);
  Py_CLEAR(A->GetTime);
  Py_CLEAR(A->NodeWalker);
  Py_CLEAR(A->TypeHintWalker);
  Py_CLEAR(A->FStringSupport);
  Py_CLEAR(A->LastFailure);
  return 0;
}

PyObject *analyzer_AnalyzeSingleLogical(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<PyObject *>(nullptr, [&] {
    static const char *Keywords[] = {"logical", "in_async_def", nullptr};
    PyObject *Logical, *InAsyncDef;
    // The host calls this once per line: positional arguments skip the parser.
    if (!Kwds && PyTuple_GET_SIZE(Args) == 2) {
      Logical = PyTuple_GET_ITEM(Args, 0);
      InAsyncDef = PyTuple_GET_ITEM(Args, 1);
    } else if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "OO:AnalyzeSingleLogical",
                                            const_cast<char **>(Keywords), &Logical, &InAsyncDef)) {
      throw tl::PyErrSet();
    }
    return analyzeSingleLogical(self(Self), Logical, tl::isTrue(InAsyncDef)).release();
  });
}

PyObject *analyzer_InspectSingleLogical(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<PyObject *>(nullptr, [&] {
    static const char *Keywords[] = {"logical", "in_async_def", "in_f_string", nullptr};
    PyObject *Logical, *InAsyncDef, *InFString = Py_False;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "OO|O:_InspectSingleLogical", const_cast<char **>(Keywords),
                                     &Logical, &InAsyncDef, &InFString))
      throw tl::PyErrSet();
    inspectSingleLogical(self(Self), Logical, tl::isTrue(InAsyncDef), tl::isTrue(InFString));
    Py_RETURN_TRUE;
  });
}

PyObject *analyzer_ParseToNode(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<PyObject *>(nullptr, [&] {
    static const char *Keywords[] = {"logical", "in_async_def", nullptr};
    PyObject *Logical, *InAsyncDef;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "OO:ParseToNode", const_cast<char **>(Keywords), &Logical,
                                     &InAsyncDef))
      throw tl::PyErrSet();
    requireReady(self(Self));
    return parseToNode(self(Self)->LogicalParser, Logical, tl::isTrue(InAsyncDef)).release();
  });
}

PyObject *analyzer_ParseTokenListToNode(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<PyObject *>(nullptr, [&] {
    static const char *Keywords[] = {"tok_list", "in_async_def", nullptr};
    PyObject *TokList, *InAsyncDef;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "OO:ParseTokenListToNode", const_cast<char **>(Keywords),
                                     &TokList, &InAsyncDef))
      throw tl::PyErrSet();
    tl::expectType(PyList_Check(TokList), "list", TokList);
    requireReady(self(Self));
    return parseTokenListToNode(self(Self)->LogicalParser, TokList, tl::isTrue(InAsyncDef)).release();
  });
}

PyObject *analyzer_FreeNodeCount(PyObject *Self, PyObject *) {
  return tl::guard<PyObject *>(nullptr, [&] {
    requireReady(self(Self));
    FactoryObject *F = self(Self)->LogicalParser->Factory;
    return PyInt_FromSsize_t(F ? factoryFreeNodeCount(F) : 0);
  });
}

PyMethodDef AnalyzerMethods[] = {
    {"AnalyzeSingleLogical", tl::kwFunction(analyzer_AnalyzeSingleLogical),
     METH_VARARGS | METH_KEYWORDS,
     "AnalyzeSingleLogical(logical, in_async_def) -> None, or the SyntaxError of a logical that does not "
     "parse"},
    {"_InspectSingleLogical", tl::kwFunction(analyzer_InspectSingleLogical),
     METH_VARARGS | METH_KEYWORDS,
     "_InspectSingleLogical(logical, in_async_def, in_f_string=False) -> True: parses and walks the logical"},
    {"_InspectFStringTokens", tl::kwFunction(fstrings::analyzer_InspectFStringTokens),
     METH_VARARGS | METH_KEYWORDS,
     "_InspectFStringTokens(logical, in_async_def): analyzes the expressions of the logical's f-strings"},
    {"_InspectSingleFStringToken", tl::kwFunction(fstrings::analyzer_InspectSingleFStringToken),
     METH_VARARGS | METH_KEYWORDS,
     "_InspectSingleFStringToken(logical, token_i, text, in_async_def): analyzes the expressions of one "
     "f-string token and copies their findings into the logical"},
    {"ParseToNode", tl::kwFunction(analyzer_ParseToNode), METH_VARARGS | METH_KEYWORDS,
     "ParseToNode(logical, in_async_def) -> CNode or None"},
    {"ParseTokenListToNode", tl::kwFunction(analyzer_ParseTokenListToNode),
     METH_VARARGS | METH_KEYWORDS, "ParseTokenListToNode(tok_list, in_async_def) -> CNode or None"},
    {"_FreeNodeCount", analyzer_FreeNodeCount, METH_NOARGS,
     "_FreeNodeCount() -> int: number of nodes on the logical parser's free lists"},
    {nullptr, nullptr, 0, nullptr}};

PyObject *orNone(PyObject *O) {
  O = O ? O : Py_None;
  Py_INCREF(O);
  return O;
}
PyObject *analyzer_getNodeWalker(PyObject *Self, void *) { return orNone(self(Self)->NodeWalker); }
PyObject *analyzer_getTypeHintWalker(PyObject *Self, void *) { return orNone(self(Self)->TypeHintWalker); }
PyObject *analyzer_getSyntaxChecks(PyObject *Self, void *) { return PyBool_FromLong(self(Self)->SyntaxChecks); }
PyObject *analyzer_getFailures(PyObject *Self, void *) { return PyInt_FromSsize_t(self(Self)->Failures); }
PyObject *analyzer_getLastFailure(PyObject *Self, void *) { return orNone(self(Self)->LastFailure); }

PyGetSetDef AnalyzerGetSets[] = {
    {const_cast<char *>("_fNodeWalker"), analyzer_getNodeWalker, nullptr,
     const_cast<char *>("the symbol walker"), nullptr},
    {const_cast<char *>("_fTypeHintWalker"), analyzer_getTypeHintWalker, nullptr,
     const_cast<char *>("the type-hint walker"), nullptr},
    {const_cast<char *>("fSyntaxChecks"), analyzer_getSyntaxChecks, nullptr,
     const_cast<char *>("whether lines are also checked as CPython checks them after parsing"), nullptr},
    {const_cast<char *>("fFailures"), analyzer_getFailures, nullptr,
     const_cast<char *>("how many unexpected failures were reported and None returned"), nullptr},
    {const_cast<char *>("fLastFailure"), analyzer_getLastFailure, nullptr,
     const_cast<char *>("repr of the last such failure's exception, or None"), nullptr},
    {nullptr, nullptr, nullptr, nullptr, nullptr}};

/// The failure paths of AnalyzeSingleLogical, with an exception pending.
Ref analysisFailed(AnalyzerObject *A, PyObject *Logical) {
  if (PyErr_ExceptionMatches(Host.ParseError)) {
    FetchedError E;
    Ref Result = Ref::steal(tl::guard<PyObject *>(nullptr, [&] {
      host::clearDerivedInfo(Logical);
      Ref Context = tl::require(PyObject_GetAttrString(E.value(), "context"));
      Py_ssize_t TokI = PyNumber_AsSsize_t(Context.get(), PyExc_OverflowError);
      if (TokI == -1 && PyErr_Occurred())
        throw tl::PyErrSet();
      return createSyntaxError(InvalidSyntax, Logical, TokI).release();
    }));
    if (Result)
      return Result;
  } else if (PyErr_ExceptionMatches(PyExc_SyntaxError)) {
    FetchedError E;
    if (Host.Fast->ClearDerivedInfo(Logical) == 0)
      return Ref::borrow(E.value());
  }
  FetchedError E;
  clearQuietly(Logical);
  // Counted before reporting: the report runs Python code and may fail.
  ++A->Failures;
  PyObject *Repr = PyObject_Repr(E.value());
  if (!Repr)
    PyErr_Clear();
  Py_XSETREF(A->LastFailure, Repr);
  reportException(E);
  return Ref::borrow(Py_None);
}

} // namespace

PyTypeObject &analyzerBaseType() { return AnalyzerBaseType; }
PyTypeObject &analyzerType() { return AnalyzerType; }

Ref analyzeSingleLogical(AnalyzerObject *A, PyObject *Logical, bool InAsyncDef) {
  if (!host::isLogical(Logical))
    tl::raise(PyExc_TypeError, "logical not a CLogicalLine");
  auto *L = reinterpret_cast<host::LogicalLineObject *>(Logical);
  if (L->Flags & fastaccess::kFlagInspected)
    return Ref::borrow(Py_None);
  L->Flags |= fastaccess::kFlagInspected;
  bool Ok = tl::guard<bool>(false, [&] {
    requireReady(A);
    host::clearDerivedInfo(Logical);
    inspectSingleLogical(A, Logical, InAsyncDef, false);
    return true;
  });
  return Ok ? Ref::borrow(Py_None) : analysisFailed(A, Logical);
}

void inspectSingleLogical(AnalyzerObject *A, PyObject *Logical, bool InAsyncDef, bool InFString) {
  requireReady(A);
  auto *L = host::requireLogicalArg(Logical, "logical");
  Ref Tree = Ref::borrow(Py_None);
  if (L->Kind != 21) {
    Tree = parseToNode(A->LogicalParser, Logical, InAsyncDef);
    if (Tree.get() == Py_None)
      return;
  }
  bool Ok = tl::guard<bool>(false, [&] {
    // An f-string's expression stands alone here: the checks of its line cover it, in its scope.
    if (A->SyntaxChecks && !InFString)
      checks::checkLine(A->LogicalParser, Tree.get(), Logical, InAsyncDef);
    walker::walk(A->NodeWalker, Tree.get(), Logical);
    hints::walk(A->TypeHintWalker, Tree.get(), Logical);
    if (!InFString)
      fstrings::inspectFStringTokens(reinterpret_cast<PyObject *>(A), Logical, InAsyncDef);
    return true;
  });
  if (!Ok && !PyErr_ExceptionMatches(PyExc_SyntaxError))
    wrapInValueError(Logical);
  discardTree(A, Tree.get());
  if (!Ok)
    throw tl::PyErrSet();
}

int initAnalyzerBaseType(PyObject *Module) {
  return tl::guard<int>(-1, [&] {
    if (Host.NodeConverterType->tp_basicsize != static_cast<Py_ssize_t>(sizeof(optpgen::NodeConverterObject)))
      tl::raise(PyExc_ImportError, "pysource.optpgen.NodeConverter is not laid out as optpgen_api.h says");
    tl::TypeDesc D;
    D.Name = "pysource.treelens.CPGenAnalyzer";
    D.Doc = "Abstract analyzer of logical lines: AnalyzeSingleLogical(logical, in_async_def).";
    D.Size = sizeof(optpgen::NodeConverterObject);
    D.Base = Host.NodeConverterType;
    D.Methods = AnalyzerBaseMethods;
    tl::requireStatus(tl::readyType(AnalyzerBaseType, D));
    tl::requireStatus(tl::addType(Module, "CPGenAnalyzer", AnalyzerBaseType));
    tl::registerPickle(AnalyzerBaseType, {}, Host.UnpickleFields);
    return 0;
  });
}

int initAnalyzerType(PyObject *Module) {
  return tl::guard<int>(-1, [&] {
    DefaultGrammar = tl::require(PyObject_GetAttrString(Module, "kPy3DefaultGrammar")).release();
    InvalidSyntax = tl::internName("invalid syntax");
    tl::TypeDesc D;
    D.Name = "pysource.treelens.CPGenAnalyzerImpl";
    D.Doc = "Analyzes logical using a parser implemented via the pgen2 package";
    D.Size = sizeof(AnalyzerObject);
    D.Base = &AnalyzerBaseType;
    D.Flags = Py_TPFLAGS_DEFAULT;
    D.Methods = AnalyzerMethods;
    D.GetSets = AnalyzerGetSets;
    D.Dealloc = tl::gcDealloc<analyzer_clear>;
    D.Traverse = analyzer_traverse;
    D.Clear = analyzer_clear;
    D.Init = analyzer_init;
    D.New = analyzer_new;
    tl::requireStatus(tl::readyType(AnalyzerType, D));
    tl::requireStatus(tl::addType(Module, "CPGenAnalyzerImpl", AnalyzerType));
    using F = tl::FieldKind;
    tl::registerPickle(AnalyzerType,
                       {{"_fLogicalParser", F::Object, offsetof(AnalyzerObject, LogicalParser), &parserType()},
                        {"__GetTime", F::Object, offsetof(AnalyzerObject, GetTime)},
                        {"_fNodeWalker", F::Object, offsetof(AnalyzerObject, NodeWalker), &walker::nodeWalkerType()},
                        {"_fTypeHintWalker", F::Object, offsetof(AnalyzerObject, TypeHintWalker),
                         &hints::typeHintWalkerType()},
                        {"_fFStringSupport", F::Object, offsetof(AnalyzerObject, FStringSupport),
                         &fstrings::fstringSupportType()},
                        {"fSyntaxChecks", F::Bool, offsetof(AnalyzerObject, SyntaxChecks)}},
                       Host.UnpickleFields);
    return 0;
  });
}

} // namespace treelens
