// The logical-line record type CLogicalLine and the operations on its derived info.
#include "pysource/_fastaccess/internal.h"
#include "pysource/_fastaccess/records.h"

#include "typedesc.h"

#include <cstring>
#include <stddef.h>

namespace fastaccess {

using tl::Ref;
using tl::guard;
using tl::raise;
using tl::raiseFormat;
using tl::require;

PyTypeObject LogicalLineType = {PyVarObject_HEAD_INIT(nullptr, 0)};

namespace {

LogicalLineObject *self(PyObject *O) { return reinterpret_cast<LogicalLineObject *>(O); }

/// Drops the token arrays (the texts are owned). The record is emptied
/// first: a text of a str subclass may run Python code as it dies.
void freeTokens(LogicalLineObject *L) {
  PyObject **Texts = L->Texts;
  Py_ssize_t N = L->TokenCount;
  L->Texts = nullptr;
  L->Positions = nullptr;
  L->Types = nullptr;
  L->TokenCount = 0;
  Py_CLEAR(L->TokensView);
  for (Py_ssize_t I = 0; I < N; ++I)
    Py_XDECREF(Texts[I]);
  PyMem_Free(Texts);
}

/// The private list in *Slot, created empty and untracked on first use (borrowed).
PyObject *derivedList(PyObject **Slot) {
  if (!*Slot) {
    *Slot = require(PyList_New(0)).release();
    PyObject_GC_UnTrack(*Slot);
  }
  return *Slot;
}

/// New reference: Obj (bytes) itself when exact, else an exact copy, so
/// that nothing in a derived list can refer back to a record.
Ref exactBytes(PyObject *Obj) {
  if (PyString_CheckExact(Obj))
    return Ref::borrow(Obj);
  return require(PyString_FromStringAndSize(PyString_AS_STRING(Obj), PyString_GET_SIZE(Obj)));
}

void appendTo(PyObject **Slot, PyObject *Item) {
  tl::requireStatus(PyList_Append(derivedList(Slot), Item));
}

// Kept records repeat the same names and infos, and the same (name, info)
// pairs (a name read is (name, kGetPrefix)): short texts are interned and
// short pairs shared through a bounded cache, so that a kept analysis holds
// one of each. Sharing is invisible: the texts and pairs are immutable.
constexpr Py_ssize_t kShareMaxLen = 80;
constexpr Py_ssize_t kMaxSharedPairs = 1 << 16;
PyObject *SharedPairs = nullptr; ///< dict: pair -> the same pair

/// New reference: exactBytes(Obj), interned when it is short.
Ref sharedBytes(PyObject *Obj) {
  Ref Text = exactBytes(Obj);
  if (PyString_GET_SIZE(Text.get()) > kShareMaxLen || PyString_CHECK_INTERNED(Text.get()))
    return Text;
  PyObject *O = Text.release();
  PyString_InternInPlace(&O);
  return Ref::steal(O);
}

/// New reference: the pair (Name, Info), shared with earlier records when short.
Ref sharedPair(PyObject *Name, PyObject *Info) {
  Ref N = sharedBytes(Name), I = sharedBytes(Info);
  Ref Pair = require(PyTuple_Pack(2, N.get(), I.get()));
  if (!PyString_CHECK_INTERNED(N.get()) || !PyString_CHECK_INTERNED(I.get()))
    return Pair;
  if (!SharedPairs)
    SharedPairs = require(PyDict_New()).release();
  if (PyObject *Found = PyDict_GetItem(SharedPairs, Pair.get()))
    return Ref::borrow(Found);
  if (PyDict_Size(SharedPairs) >= kMaxSharedPairs)
    PyDict_Clear(SharedPairs);
  tl::requireStatus(PyDict_SetItem(SharedPairs, Pair.get(), Pair.get()));
  return Pair;
}

void appendBytes(PyObject **Slot, PyObject *Text) { appendTo(Slot, sharedBytes(Text).get()); }

void appendPair(PyObject **Slot, PyObject *Name, PyObject *Info) {
  appendTo(Slot, sharedPair(Name, Info).get());
}

/// New reference: a copy of a derived list (empty when there is none).
Ref copyOf(PyObject *List) {
  if (!List)
    return require(PyList_New(0));
  return require(PyList_GetSlice(List, 0, PyList_GET_SIZE(List)));
}

/// New reference: a derived list as a tuple (empty when there is none).
Ref tupleOf(PyObject *List) {
  if (!List)
    return require(PyTuple_New(0));
  return require(PyList_AsTuple(List));
}

// ---- records the collector does not track

/// Records built by the splitter are not tracked by the cyclic collector:
/// they hold bytes, private lists of bytes and pairs of bytes, and their
/// parents, records of the same split, so they cannot be part of a cycle, and
/// a host that keeps many of them would otherwise pay for their traversal in
/// every full collection. Invariant: a record is untracked exactly when it
/// is linked in the ring through Untracked; the parent chain of an untracked
/// record holds only untracked records.
LogicalLineObject Untracked{};

bool isUntracked(LogicalLineObject *L) { return L->UntrackedNext != nullptr; }

void linkUntracked(LogicalLineObject *L) {
  if (!Untracked.UntrackedNext)
    Untracked.UntrackedNext = Untracked.UntrackedPrev = &Untracked;
  L->UntrackedPrev = &Untracked;
  L->UntrackedNext = Untracked.UntrackedNext;
  Untracked.UntrackedNext->UntrackedPrev = L;
  Untracked.UntrackedNext = L;
}

void unlinkUntracked(LogicalLineObject *L) {
  L->UntrackedPrev->UntrackedNext = L->UntrackedNext;
  L->UntrackedNext->UntrackedPrev = L->UntrackedPrev;
  L->UntrackedPrev = L->UntrackedNext = nullptr;
}

/// Called before Python code gives an untracked record a reference to
/// anything: a cycle through it could pass through any record whose parent
/// chain leads to this one, so every untracked record becomes tracked.
void beforeArbitraryReference(LogicalLineObject *L) {
  if (!isUntracked(L))
    return;
  while (Untracked.UntrackedNext != &Untracked) {
    LogicalLineObject *R = Untracked.UntrackedNext;
    unlinkUntracked(R);
    PyObject_GC_Track(R);
  }
}

Py_ssize_t checkIndex(LogicalLineObject *L, PyObject *Index) {
  Py_ssize_t I = PyNumber_AsSsize_t(Index, PyExc_IndexError);
  if (I == -1 && PyErr_Occurred())
    throw tl::PyErrSet();
  if (I < 0 || I >= L->TokenCount)
    raise(PyExc_IndexError, msg::Index);
  return I;
}

long firstLineIndent(PyObject *LineText) {
  size_t After;
  return tokcore::indentColumn(PyString_AS_STRING(LineText),
                               static_cast<size_t>(PyString_GET_SIZE(LineText)), 0, &After);
}

/// Items of a 2-tuple or 2-list (borrowed); false for anything else.
bool pairOf(PyObject *O, PyObject **First, PyObject **Second) {
  if (PyTuple_Check(O) && PyTuple_GET_SIZE(O) == 2) {
    *First = PyTuple_GET_ITEM(O, 0);
    *Second = PyTuple_GET_ITEM(O, 1);
    return true;
  }
  if (PyList_Check(O) && PyList_GET_SIZE(O) == 2) {
    *First = PyList_GET_ITEM(O, 0);
    *Second = PyList_GET_ITEM(O, 1);
    return true;
  }
  return false;
}

int32_t positionPart(PyObject *O) {
  long V = PyInt_AsLong(O);
  if (V == -1 && PyErr_Occurred())
    throw tl::PyErrSet();
  if (V < INT32_MIN || V > INT32_MAX)
    raise(PyExc_OverflowError, msg::Position);
  return static_cast<int32_t>(V);
}

// ---- slots

int logical_traverse(PyObject *O, visitproc visit, void *arg) {
  LogicalLineObject *L = self(O);
  Py_VISIT(L->ParentScope);
  Py_VISIT(L->LocalScopeDefined);
  Py_VISIT(L->NamesDefined);
  Py_VISIT(L->TypeEquivs);
  Py_VISIT(L->ArgNames);
  Py_VISIT(L->ArgTypeEquivs);
  Py_VISIT(L->BaseClassNames);
  Py_VISIT(L->TokensView);
  Py_VISIT(L->Dict);
  return 0;
}

int logical_clear(PyObject *O) {
  LogicalLineObject *L = self(O);
  Py_CLEAR(L->ParentScope);
  Py_CLEAR(L->LocalScopeDefined);
  Py_CLEAR(L->NamesDefined);
  Py_CLEAR(L->TypeEquivs);
  Py_CLEAR(L->ArgNames);
  Py_CLEAR(L->ArgTypeEquivs);
  Py_CLEAR(L->BaseClassNames);
  Py_CLEAR(L->TokensView);
  Py_CLEAR(L->Dict);
  return 0;
}

/// Dead exact records kept for reuse by the splitter, linked through
/// ParentScope. Invariant: FreeCount of them, each untracked with every
/// owned field cleared.
LogicalLineObject *FreeList = nullptr;
int FreeCount = 0;
constexpr int kMaxFree = 4096;

void logical_dealloc(PyObject *O) {
  LogicalLineObject *L = self(O);
  if (isUntracked(L))
    unlinkUntracked(L);
  PyObject_GC_UnTrack(O);
  // Parent chains can be long; the trashcan bounds the C stack.
  Py_TRASHCAN_SAFE_BEGIN(O)
  if (L->WeakRefs)
    PyObject_ClearWeakRefs(O);
  logical_clear(O);
  freeTokens(L);
  Py_CLEAR(L->LineText);
  if (Py_TYPE(O) == &LogicalLineType && FreeCount < kMaxFree) {
    L->ParentScope = reinterpret_cast<PyObject *>(FreeList);
    FreeList = L;
    ++FreeCount;
  } else {
    Py_TYPE(O)->tp_free(O);
  }
  Py_TRASHCAN_SAFE_END(O)
}

// CLogicalLine(tokens, kind=0, first_line=0, line_text=b"")
int logical_init(PyObject *O, PyObject *Args, PyObject *Kwds) {
  return guard(-1, [&] {
    static const char *Names[] = {"tokens", "kind", "first_line", "line_text", nullptr};
    PyObject *Tokens;
    int Kind = 0;
    long FirstLine = 0;
    PyObject *LineText = nullptr;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "O|ilS:CLogicalLine",
                                     const_cast<char **>(Names), &Tokens, &Kind, &FirstLine,
                                     &LineText))
      return -1;
    Ref Seq = Ref::steal(PySequence_Fast(Tokens, msg::Tokens));
    if (!Seq)
      return -1;
    if (PyList_Check(Seq.get())) // Python code run below must not resize it
      Seq = require(PyList_AsTuple(Seq.get()));
    Ref Line = LineText ? Ref::borrow(LineText) : require(PyString_FromString(""));
    Py_ssize_t N = PySequence_Fast_GET_SIZE(Seq.get());
    TokenArrays A(N);
    for (Py_ssize_t I = 0; I < N; ++I) {
      PyObject *Item = PySequence_Fast_GET_ITEM(Seq.get(), I);
      PyObject *Str, *Pos;
      if (!pairOf(Item, &Str, &Pos))
        raise(PyExc_TypeError, msg::Tokens);
      if (!PyString_Check(Str))
        raiseFormat(PyExc_TypeError, msg::TokenText, Py_TYPE(Str)->tp_name);
      PyObject *Row, *Col;
      if (!pairOf(Pos, &Row, &Col))
        raise(PyExc_TypeError, msg::Tokens);
      // Converting the position may run Python code that changes the lists.
      Ref Text = Ref::borrow(Str), RowRef = Ref::borrow(Row), ColRef = Ref::borrow(Col);
      TokenPos P{positionPart(RowRef.get()), positionPart(ColRef.get())};
      A.set(I, std::move(Text), P,
            static_cast<uint8_t>(tokcore::classifyText(
                PyString_AS_STRING(Str), static_cast<size_t>(PyString_GET_SIZE(Str)))));
    }
    LogicalLineObject *L = self(O);
    freeTokens(L);
    A.moveInto(L);
    L->Kind = Kind;
    L->FirstLine = FirstLine;
    L->Indent = firstLineIndent(Line.get());
    Py_XSETREF(L->LineText, Line.release());
    return 0;
  });
}

PyObject *logical_repr(PyObject *O) {
  LogicalLineObject *L = self(O);
  return PyString_FromFormat("<%s kind=%d line=%ld tokens=%zd>", Py_TYPE(O)->tp_name,
                             static_cast<int>(L->Kind), L->FirstLine, L->TokenCount);
}

// ---- attributes

PyObject *get_tokens(PyObject *O, void *) {
  return guard<PyObject *>(nullptr, [&] {
    LogicalLineObject *L = self(O);
    if (!L->TokensView) {
      Ref View = require(PyTuple_New(L->TokenCount));
      for (Py_ssize_t I = 0; I < L->TokenCount; ++I) {
        PyObject *Text = L->Texts[I] ? L->Texts[I] : Py_None;
        Ref Pair = require(Py_BuildValue("O(ii)", Text, static_cast<int>(L->Positions[I].Row),
                                         static_cast<int>(L->Positions[I].Col)));
        PyTuple_SET_ITEM(View.get(), I, Pair.release());
      }
      L->TokensView = View.release();
    }
    return Ref::borrow(L->TokensView).release();
  });
}

PyObject *get_token_count(PyObject *O, void *) { return PyInt_FromSsize_t(self(O)->TokenCount); }
PyObject *get_kind(PyObject *O, void *) { return PyInt_FromLong(self(O)->Kind); }
PyObject *get_first_line(PyObject *O, void *) { return PyInt_FromLong(self(O)->FirstLine); }
PyObject *get_indent(PyObject *O, void *) { return PyInt_FromLong(self(O)->Indent); }

PyObject *get_line_text(PyObject *O, void *) {
  PyObject *T = self(O)->LineText;
  if (!T)
    return PyString_FromString("");
  Py_INCREF(T);
  return T;
}

PyObject *get_inspected(PyObject *O, void *) {
  return PyBool_FromLong(self(O)->Flags & kFlagInspected);
}

int set_inspected(PyObject *O, PyObject *V, void *) {
  if (!V) {
    PyErr_SetString(PyExc_TypeError, msg::NoDelete);
    return -1;
  }
  int On = PyObject_IsTrue(V);
  if (On < 0)
    return -1;
  LogicalLineObject *L = self(O);
  L->Flags = On ? (L->Flags | kFlagInspected) : (L->Flags & ~kFlagInspected);
  return 0;
}

PyObject *get_truncated(PyObject *O, void *) {
  return PyBool_FromLong(self(O)->Flags & kFlagTruncated);
}

PyObject *optional(PyObject *V) {
  if (!V)
    V = Py_None;
  Py_INCREF(V);
  return V;
}

PyObject *get_parent_scope(PyObject *O, void *) { return optional(self(O)->ParentScope); }

int set_parent_scope(PyObject *O, PyObject *V, void *) {
  if (V == Py_None)
    V = nullptr;
  if (V && !PyObject_TypeCheck(V, &LogicalLineType)) {
    PyErr_SetString(PyExc_TypeError, msg::ParentScope);
    return -1;
  }
  if (V)
    beforeArbitraryReference(self(O));
  Py_XINCREF(V);
  Py_XSETREF(self(O)->ParentScope, V);
  return 0;
}

PyObject *get_local_scope(PyObject *O, void *) { return optional(self(O)->LocalScopeDefined); }

int set_local_scope(PyObject *O, PyObject *V, void *) {
  if (V == Py_None)
    V = nullptr;
  if (V && !PyString_CheckExact(V))
    beforeArbitraryReference(self(O));
  Py_XINCREF(V);
  Py_XSETREF(self(O)->LocalScopeDefined, V);
  return 0;
}

/// Attributes other than the fields go to the instance dict, where they can
/// refer to anything; the fields' setters decide for themselves.
int logical_setattro(PyObject *O, PyObject *Name, PyObject *V) {
  PyObject *Descr = _PyType_Lookup(Py_TYPE(O), Name); // borrowed
  if (V && !(Descr && Py_TYPE(Descr)->tp_descr_set))
    beforeArbitraryReference(self(O));
  return PyObject_GenericSetAttr(O, Name, V);
}

template <PyObject *LogicalLineObject::*Field> PyObject *get_list(PyObject *O, void *) {
  return guard<PyObject *>(nullptr, [&] { return copyOf(self(O)->*Field).release(); });
}

// ---- methods

PyObject *m_get_token_string(PyObject *O, PyObject *Index) {
  return guard<PyObject *>(nullptr, [&] {
    LogicalLineObject *L = self(O);
    PyObject *T = L->Texts[checkIndex(L, Index)];
    return Ref::borrow(T ? T : Py_None).release();
  });
}

PyObject *m_append_type_equiv(PyObject *O, PyObject *Args) {
  PyObject *Name, *Info;
  if (!PyArg_ParseTuple(Args, "OO:AppendTypeEquiv", &Name, &Info))
    return nullptr;
  if (appendTypeEquiv(O, Name, Info) < 0)
    return nullptr;
  Py_RETURN_NONE;
}

PyObject *m_append_arg_type_equiv(PyObject *O, PyObject *Args) {
  return guard<PyObject *>(nullptr, [&]() -> PyObject * {
    PyObject *Name, *Info;
    if (!PyArg_ParseTuple(Args, "OO:AppendArgTypeEquiv", &Name, &Info))
      return nullptr;
    expectBytes(Name);
    expectBytes(Info);
    appendPair(&self(O)->ArgTypeEquivs, Name, Info);
    Py_RETURN_NONE;
  });
}

template <PyObject *LogicalLineObject::*Field> PyObject *m_append_bytes(PyObject *O, PyObject *V) {
  return guard<PyObject *>(nullptr, [&]() -> PyObject * {
    expectBytes(V);
    appendBytes(&(self(O)->*Field), V);
    Py_RETURN_NONE;
  });
}

PyObject *m_get_derived_info(PyObject *O, PyObject *) {
  return guard<PyObject *>(nullptr, [&]() -> PyObject * {
    LogicalLineObject *L = self(O);
    PyObject *Lists[] = {L->NamesDefined, L->TypeEquivs, L->ArgNames, L->ArgTypeEquivs,
                         L->BaseClassNames};
    bool Any = false;
    for (PyObject *List : Lists)
      Any = Any || (List && PyList_GET_SIZE(List));
    if (!Any)
      Py_RETURN_NONE;
    Ref Result = require(PyTuple_New(5));
    for (Py_ssize_t I = 0; I < 5; ++I)
      PyTuple_SET_ITEM(Result.get(), I, tupleOf(Lists[I]).release());
    return Result.release();
  });
}

PyMethodDef Methods[] = {
    {"GetTokenString", m_get_token_string, METH_O,
     "GetTokenString(i) -> bytes: the text of token i."},
    {"AppendTypeEquiv", m_append_type_equiv, METH_VARARGS,
     "AppendTypeEquiv(name, info): appends (name, info) to fTypeEquivs."},
    {"AppendArgName", m_append_bytes<&LogicalLineObject::ArgNames>, METH_O,
     "AppendArgName(name): appends to fArgNames."},
    {"AppendArgTypeEquiv", m_append_arg_type_equiv, METH_VARARGS,
     "AppendArgTypeEquiv(name, info): appends (name, info) to fArgTypeEquivs."},
    {"AppendBaseClassName", m_append_bytes<&LogicalLineObject::BaseClassNames>, METH_O,
     "AppendBaseClassName(text): appends to fBaseClassNames."},
    {"AppendNameDefined", m_append_bytes<&LogicalLineObject::NamesDefined>, METH_O,
     "AppendNameDefined(name): appends to fNamesDefined."},
    {"GetDerivedInfo", m_get_derived_info, METH_NOARGS,
     "GetDerivedInfo() -> None when nothing is recorded, else the tuple (fNamesDefined,\n"
     "fTypeEquivs, fArgNames, fArgTypeEquivs, fBaseClassNames), each as a tuple."},
    {nullptr, nullptr, 0, nullptr}};

#define TL_GET(Name, Fn, Doc) {const_cast<char *>(Name), Fn, nullptr, const_cast<char *>(Doc), nullptr}
#define TL_GETSET(Name, Get, Set, Doc)                                                            \
  {const_cast<char *>(Name), Get, Set, const_cast<char *>(Doc), nullptr}

PyGetSetDef GetSets[] = {
    TL_GET("fTokens", get_tokens, "tuple of (text, (row, col)) pairs, built on first use"),
    TL_GET("fTokenCount", get_token_count, "number of tokens"),
    TL_GET("fKind", get_kind, "0 statement, 1 class, 2 def, 11 try, 21 comment, 22 blank"),
    TL_GETSET("fInspected", get_inspected, set_inspected, "set once the analyzer has seen it"),
    TL_GET("fTruncated", get_truncated,
           "whether the analysis stopped at the walker's limits, recording only what came before"),
    TL_GETSET("fParentScope", get_parent_scope, set_parent_scope,
              "the enclosing def/class logical, or None"),
    TL_GETSET("fLocalScopeDefined", get_local_scope, set_local_scope,
              "cached name of the scope this logical defines, or None"),
    TL_GET("fFirstLine", get_first_line, "0-based line number of the first physical line"),
    TL_GET("fLineText", get_line_text, "the physical lines of the logical, line ends included"),
    TL_GET("fIndent", get_indent, "indentation column of the first line"),
    TL_GET("fNamesDefined", get_list<&LogicalLineObject::NamesDefined>, "names defined"),
    TL_GET("fTypeEquivs", get_list<&LogicalLineObject::TypeEquivs>, "(name, info) pairs"),
    TL_GET("fArgNames", get_list<&LogicalLineObject::ArgNames>, "argument names by position"),
    TL_GET("fArgTypeEquivs", get_list<&LogicalLineObject::ArgTypeEquivs>,
           "(name, info) pairs of arguments"),
    TL_GET("fBaseClassNames", get_list<&LogicalLineObject::BaseClassNames>, "base class texts"),
    {nullptr, nullptr, nullptr, nullptr, nullptr}};

} // namespace

// ---- shared operations

LogicalLineObject *asLogical(PyObject *Obj) {
  if (!Obj || !PyObject_TypeCheck(Obj, &LogicalLineType))
    raise(PyExc_TypeError, msg::NotLogical);
  return self(Obj);
}

void expectBytes(PyObject *Obj) { tl::expectType(PyString_Check(Obj), msg::Bytes, Obj); }

int clearDerivedInfo(PyObject *Logical) {
  return guard(-1, [&] {
    LogicalLineObject *L = asLogical(Logical);
    L->Flags &= ~kFlagTruncated;
    PyObject *Lists[] = {L->NamesDefined, L->TypeEquivs, L->ArgNames, L->ArgTypeEquivs,
                         L->BaseClassNames};
    for (PyObject *List : Lists)
      if (List && PyList_GET_SIZE(List))
        tl::requireStatus(PyList_SetSlice(List, 0, PyList_GET_SIZE(List), nullptr));
    return 0;
  });
}

// A bare name goes to fNamesDefined; of a (name, info) pair only the name goes
// there: callers record the info with AppendLogicalTypeEquiv, so it is kept once.
int appendAttrib(PyObject *Logical, PyObject *Attrib) {
  return guard(-1, [&] {
    LogicalLineObject *L = asLogical(Logical);
    if (PyString_Check(Attrib)) {
      appendBytes(&L->NamesDefined, Attrib);
      return 0;
    }
    if (!PyTuple_Check(Attrib) || PyTuple_GET_SIZE(Attrib) != 2 ||
        !PyString_Check(PyTuple_GET_ITEM(Attrib, 0)))
      raiseFormat(PyExc_TypeError, msg::Attrib, Py_TYPE(Attrib)->tp_name);
    PyObject *Name = PyTuple_GET_ITEM(Attrib, 0);
    PyObject *Info = PyTuple_GET_ITEM(Attrib, 1);
    expectBytes(Info);
    appendBytes(&L->NamesDefined, Name);
    return 0;
  });
}

int appendTypeEquiv(PyObject *Logical, PyObject *Name, PyObject *Info) {
  return guard(-1, [&] {
    LogicalLineObject *L = asLogical(Logical);
    expectBytes(Name);
    expectBytes(Info);
    appendPair(&L->TypeEquivs, Name, Info);
    return 0;
  });
}

// ---- TokenArrays

TokenArrays::TokenArrays(Py_ssize_t N) : Count(N) {
  if (N == 0)
    return;
  size_t Bytes = static_cast<size_t>(N) * (sizeof(PyObject *) + sizeof(TokenPos) + 1);
  Block = static_cast<PyObject **>(PyMem_Malloc(Bytes));
  if (!Block)
    throw std::bad_alloc();
  for (Py_ssize_t I = 0; I < N; ++I)
    Block[I] = nullptr;
}

TokenArrays::~TokenArrays() {
  for (Py_ssize_t I = 0; Block && I < Count; ++I)
    Py_XDECREF(Block[I]);
  PyMem_Free(Block);
}

void TokenArrays::moveInto(LogicalLineObject *L) {
  L->Texts = Block;
  L->Positions = positions();
  L->Types = types();
  L->TokenCount = Count;
  Block = nullptr;
  Count = 0;
}

LogicalLineObject *newLogical(TokenArrays &A, int Kind, long FirstLine, long Indent,
                              Ref LineText) {
  LogicalLineObject *L = FreeList;
  if (L) {
    FreeList = reinterpret_cast<LogicalLineObject *>(L->ParentScope);
    --FreeCount;
    std::memset(reinterpret_cast<char *>(L) + sizeof(PyObject), 0,
                sizeof(LogicalLineObject) - sizeof(PyObject));
    _Py_NewReference(reinterpret_cast<PyObject *>(L));
  } else {
    PyObject *O = LogicalLineType.tp_alloc(&LogicalLineType, 0);
    if (!O)
      throw tl::PyErrSet();
    PyObject_GC_UnTrack(O);
    L = self(O);
  }
  linkUntracked(L);
  A.moveInto(L);
  L->Kind = Kind;
  L->FirstLine = FirstLine;
  L->Indent = Indent;
  L->LineText = LineText.release();
  return L;
}

int clearLogicalFreeList() {
  int N = FreeCount;
  while (FreeList) {
    LogicalLineObject *L = FreeList;
    FreeList = reinterpret_cast<LogicalLineObject *>(L->ParentScope);
    L->ParentScope = nullptr;
    PyObject_GC_Del(L);
  }
  FreeCount = 0;
  return N;
}

int initLogicalLineType() {
  tl::TypeDesc D;
  D.Name = "pysource._fastaccess.CLogicalLine";
  D.Doc = "CLogicalLine(tokens, kind=0, first_line=0, line_text=b'')\n\n"
          "A logical line: its tokens as (text, (row, col)) pairs, row 0 being the\n"
          "logical's first physical line and col a byte offset in that line.";
  D.Size = sizeof(LogicalLineObject);
  D.Flags = Py_TPFLAGS_DEFAULT | Py_TPFLAGS_BASETYPE;
  D.Methods = Methods;
  D.GetSets = GetSets;
  D.Dealloc = logical_dealloc;
  D.Traverse = logical_traverse;
  D.Clear = logical_clear;
  D.Init = logical_init;
  D.New = PyType_GenericNew;
  D.Repr = logical_repr;
  D.WeakListOffset = offsetof(LogicalLineObject, WeakRefs);
  LogicalLineType.tp_dictoffset = offsetof(LogicalLineObject, Dict);
  LogicalLineType.tp_setattro = logical_setattro;
  return tl::readyType(LogicalLineType, D);
}

} // namespace fastaccess
