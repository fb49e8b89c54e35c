// Reads a grammar object (labels, keywords, tokens, dfas, start) into a
// pgen::GrammarSource, compiles it and caches the tables per object.
#include "tables.h"

#include "messages.h"

#include <string>

namespace optpgen {

namespace {

using tl::Ref;
using tl::require;

/// grammar object -> capsule of a heap GrammarPtr; weak keys, so the tables
/// die with the grammar.
PyObject *Cache = nullptr;
long BuiltCount = 0;
const char *const CapsuleName = "pysource.optpgen.tables";

[[noreturn]] void bad(const std::string &Detail) {
  tl::raiseFormat(PyExc_ValueError, msg::BadGrammar, Detail.c_str());
}

int readInt(PyObject *O, const char *What) {
  long V;
  if (PyInt_Check(O)) {
    V = PyInt_AS_LONG(O);
  } else if (PyLong_Check(O)) {
    int Overflow = 0;
    V = PyLong_AsLongAndOverflow(O, &Overflow);
    if (V == -1 && PyErr_Occurred())
      throw tl::PyErrSet();
    if (Overflow)
      bad(std::string(What) + " is out of range");
  } else {
    bad(std::string(What) + " is not an int");
  }
  if (V < -0x7fffffffL || V > 0x7fffffffL)
    bad(std::string(What) + " is out of range");
  return static_cast<int>(V);
}

/// A tuple of O's items: reading a grammar can run Python code (an item's
/// __iter__, a label's __int__), which must not change what is being read.
Ref sequence(PyObject *O, const char *What) {
  PyObject *S = PySequence_Tuple(O);
  if (!S) {
    PyErr_Clear();
    bad(std::string(What) + " is not a sequence");
  }
  return Ref::steal(S);
}

/// Items of a mapping as a fast sequence of pairs.
Ref mappingItems(PyObject *O, const char *What) {
  if (PyDict_Check(O))
    return require(PyDict_Items(O));
  PyObject *Items = PyObject_CallMethod(O, const_cast<char *>("items"), nullptr);
  if (!Items) {
    PyErr_Clear();
    bad(std::string(What) + " is not a mapping");
  }
  return sequence(Ref::steal(Items).get(), What);
}

/// Splits a pair into its two items (borrowed from Holder).
void pair(PyObject *O, const char *What, Ref &Holder, PyObject *&A,
          PyObject *&B) {
  Holder = sequence(O, What);
  if (PySequence_Fast_GET_SIZE(Holder.get()) != 2)
    bad(std::string(What) + " is not a pair");
  A = PySequence_Fast_GET_ITEM(Holder.get(), 0);
  B = PySequence_Fast_GET_ITEM(Holder.get(), 1);
}

std::string keywordText(PyObject *O) {
  Ref Bytes;
  if (PyUnicode_Check(O)) {
    Bytes = require(PyUnicode_AsUTF8String(O));
    O = Bytes.get();
  }
  if (!PyString_Check(O))
    bad("a keyword is not a string");
  return std::string(PyString_AS_STRING(O), PyString_GET_SIZE(O));
}

Ref attr(PyObject *G, const char *Name) {
  return require(PyObject_GetAttrString(G, Name));
}

pgen::GrammarSource readGrammar(PyObject *G) {
  pgen::GrammarSource Src;
  PyObject *A, *B;
  Ref Pair;

  // labels: [(type, value)], value a keyword text or None.
  Ref Labels = sequence(attr(G, "labels").get(), "labels");
  Py_ssize_t N = PySequence_Fast_GET_SIZE(Labels.get());
  Src.Labels.reserve(N);
  for (Py_ssize_t I = 0; I < N; ++I) {
    pair(PySequence_Fast_GET_ITEM(Labels.get(), I), "a label", Pair, A, B);
    Src.Labels.push_back(readInt(A, "a label type"));
  }

  // keywords: {text: label}; tokens: {type: label}.
  Ref Items = mappingItems(attr(G, "keywords").get(), "keywords");
  N = PySequence_Fast_GET_SIZE(Items.get());
  for (Py_ssize_t I = 0; I < N; ++I) {
    pair(PySequence_Fast_GET_ITEM(Items.get(), I), "a keyword", Pair, A, B);
    Src.Keywords.emplace_back(keywordText(A), readInt(B, "a keyword label"));
  }
  Items = mappingItems(attr(G, "tokens").get(), "tokens");
  N = PySequence_Fast_GET_SIZE(Items.get());
  for (Py_ssize_t I = 0; I < N; ++I) {
    pair(PySequence_Fast_GET_ITEM(Items.get(), I), "a token", Pair, A, B);
    Src.Tokens.emplace_back(readInt(A, "a token type"),
                            readInt(B, "a token label"));
  }

  // dfas: {symbol: (states, first)}; states: [[(label, next)]]; first: the
  // labels that start the symbol (a mapping's keys or any iterable).
  Items = mappingItems(attr(G, "dfas").get(), "dfas");
  N = PySequence_Fast_GET_SIZE(Items.get());
  Src.Dfas.resize(N);
  for (Py_ssize_t I = 0; I < N; ++I) {
    pgen::GrammarSource::Dfa &D = Src.Dfas[I];
    pair(PySequence_Fast_GET_ITEM(Items.get(), I), "a dfa entry", Pair, A, B);
    D.Symbol = readInt(A, "a symbol number");
    Ref Entry;
    PyObject *States, *First;
    pair(B, "a dfa", Entry, States, First);
    Ref StateSeq = sequence(States, "dfa states");
    Py_ssize_t NS = PySequence_Fast_GET_SIZE(StateSeq.get());
    D.States.resize(NS);
    for (Py_ssize_t S = 0; S < NS; ++S) {
      Ref Arcs = sequence(PySequence_Fast_GET_ITEM(StateSeq.get(), S),
                          "a dfa state");
      Py_ssize_t NA = PySequence_Fast_GET_SIZE(Arcs.get());
      D.States[S].resize(NA);
      for (Py_ssize_t K = 0; K < NA; ++K) {
        Ref ArcPair;
        PyObject *L, *Next;
        pair(PySequence_Fast_GET_ITEM(Arcs.get(), K), "an arc", ArcPair, L,
             Next);
        D.States[S][K].Label = readInt(L, "an arc label");
        D.States[S][K].Next = readInt(Next, "an arc target");
      }
    }
    Ref It = Ref::steal(PyObject_GetIter(First));
    if (!It) {
      PyErr_Clear();
      bad("a first set is not iterable");
    }
    while (PyObject *L = PyIter_Next(It.get())) {
      Ref Label = Ref::steal(L);
      D.First.push_back(readInt(Label.get(), "a first set label"));
    }
    if (PyErr_Occurred())
      throw tl::PyErrSet();
  }

  Src.Start = readInt(attr(G, "start").get(), "start");
  return Src;
}

GrammarPtr compileGrammar(PyObject *G) {
  pgen::GrammarSource Src = readGrammar(G);
  std::string Error;
  std::unique_ptr<pgen::Grammar> Compiled = pgen::Grammar::compile(Src, Error);
  if (!Compiled)
    bad(Error);
  ++BuiltCount;
  return GrammarPtr(std::move(Compiled));
}

void destroyCapsule(PyObject *Capsule) {
  delete static_cast<GrammarPtr *>(PyCapsule_GetPointer(Capsule, CapsuleName));
}

} // namespace

GrammarPtr tablesFor(PyObject *G) {
  bool Cacheable = PyType_SUPPORTS_WEAKREFS(Py_TYPE(G));
  if (Cacheable) {
    if (PyObject *Found = PyObject_GetItem(Cache, G)) {
      Ref Capsule = Ref::steal(Found);
      void *P = PyCapsule_GetPointer(Capsule.get(), CapsuleName);
      if (!P)
        throw tl::PyErrSet();
      return *static_cast<GrammarPtr *>(P);
    }
    if (PyErr_ExceptionMatches(PyExc_TypeError))
      Cacheable = false; // unhashable: compiled for this parser alone
    else if (!PyErr_ExceptionMatches(PyExc_KeyError))
      throw tl::PyErrSet();
    PyErr_Clear();
  }
  GrammarPtr Tables = compileGrammar(G);
  if (Cacheable) {
    std::unique_ptr<GrammarPtr> Held(new GrammarPtr(Tables));
    Ref Capsule =
        require(PyCapsule_New(Held.get(), CapsuleName, destroyCapsule));
    Held.release();
    tl::requireStatus(PyObject_SetItem(Cache, G, Capsule.get()));
  }
  return Tables;
}

long tablesBuilt() { return BuiltCount; }

int initTables() {
  return tl::guard(-1, [] {
    Ref WeakRef = require(PyImport_ImportModule("weakref"));
    Cache = require(PyObject_CallMethod(WeakRef.get(),
                                        const_cast<char *>("WeakKeyDictionary"),
                                        nullptr))
                .release();
    return 0;
  });
}

} // namespace optpgen
