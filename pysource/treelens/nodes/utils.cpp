// Node and token utilities shared by the walkers, the converter and the f-string code.
#include "pysource/treelens/nodes/utils.h"

#include "pysource/treelens/host/host.h"
#include "pysource/treelens/nodes/expr.h"
#include "pysource/treelens/nodes/nodehelp.h"

#include <string>

namespace treelens {

using tl::Ref;
using namespace nodehelp;
using C = NodeClass;

namespace {

struct UtilTexts {
  PyObject *Colon, *DoubleStar, *For, *Comma;
};

const UtilTexts &texts() {
  static const UtilTexts Texts = {tl::internName(":"), tl::internName("**"), tl::internName("for"),
                                  tl::internName(",")};
  return Texts;
}

/// The atom's initial bracket is Lit (GetInitialBracket honouring overrides).
bool bracketIs(NodeObject *Atom, const char *Lit) {
  Ref B = atomGetInitialBracket(Atom);
  return textIs(B.get(), Lit);
}

} // namespace

Py_ssize_t getTokenEndIndex(PyObject *Node) noexcept {
  return tl::guard<Py_ssize_t>(-2, [&] {
    if (!isNode(Node))
      raiseCannotConvert(Node, cnodeType());
    Ref Current = Ref::borrow(Node);
    // A tree is at most MaxNativeNesting deep; a longer chain is a cycle.
    for (int Steps = 0; nodeGetChildCount(node(Current.get())) != 0; ++Steps) {
      if (Steps == tl::MaxNativeNesting)
        tl::raise(PyExc_RuntimeError, "maximum recursion depth exceeded while finding the last token");
      Current = ref(childAt(node(Current.get()), -1));
    }
    PyObject *Context = node(Current.get())->Context;
    if (!Context || (!PyInt_Check(Context) && !PyLong_Check(Context)))
      tl::raiseFormat(PyExc_TypeError, "unsupported operand type(s) for +: '%.100s' and 'int'",
                      Context ? Py_TYPE(Context)->tp_name : "NoneType");
    Py_ssize_t Index = PyInt_AsSsize_t(Context);
    if (Index == -1 && PyErr_Occurred())
      throw tl::PyErrSet();
    if (Index == PY_SSIZE_T_MAX)
      tl::raise(PyExc_OverflowError, "token index too large");
    return Index + 1;
  });
}

PyObject *nextNonRemovedTokenInLogical(PyObject *Logical, Py_ssize_t I) {
  PyObject *T = host::nextNonRemovedTokenInLogical(host::requireLogical(Logical), I);
  return T ? T : Py_None;
}

PyObject *nextNonRemovedTokenInList(PyObject *TokList, Py_ssize_t I) {
  PyObject *T = host::nextNonRemovedTokenInList(TokList, I);
  return T ? T : Py_None;
}

// A set display has no ':' among the direct children of its contents; '**'
// there is dict unpacking ({**a}), which makes it a dict too.
bool isSetLiteral(PyObject *Atom) {
  return neverRaises("pysource.treelens.IsSetLiteral", false, [&] {
    if (!isNodeOf(Atom, C::CAtom))
      return false;
    NodeObject *N = node(Atom);
    if (!bracketIs(N, "{") || nodeGetChildCount(N) != 3)
      return false;
    NodeObject *Inner = childAt(N, 1);
    if (nodeGetChildCount(Inner) == 0)
      return true;
    return !nodeDoesChildTextMatch(Inner, texts().Colon) &&
           !nodeDoesChildTextMatch(Inner, texts().DoubleStar);
  });
}

// The contents of "(" ... ")" hold the comprehension clause as child 1 (or,
// in a grammar that lists it directly, a "for" token).
bool isGenExpression(PyObject *Atom) {
  return neverRaises("pysource.treelens.IsGenExpression", false, [&] {
    if (!isNodeOf(Atom, C::CAtom))
      return false;
    NodeObject *N = node(Atom);
    if (nodeGetChildCount(N) != 3 || !bracketIs(N, "("))
      return false;
    NodeObject *Inner = childAt(N, 1);
    Py_ssize_t Count = nodeGetChildCount(Inner);
    if (Count == 0)
      return false;
    if (nodeDoesChildTextMatch(Inner, texts().For))
      return true;
    return Count > 1 && isNodeOf(obj(childAt(Inner, 1)), C::CCompForNode);
  });
}

bool isTupleExpression(PyObject *Atom) {
  return neverRaises("pysource.treelens.IsTupleExpression", false, [&] {
    if (!isNodeOf(Atom, C::CAtom))
      return false;
    NodeObject *N = node(Atom);
    if (!bracketIs(N, "("))
      return false;
    if (nodeGetChildCount(N) != 3)
      return true;
    NodeObject *Inner = childAt(N, 1);
    if (nodeGetChildCount(Inner) == 0)
      return false;
    return nodeDoesChildTextMatch(Inner, texts().Comma);
  });
}

Ref dropSimpleParens(PyObject *Node) {
  Ref Current = Ref::borrow(Node);
  for (int Steps = 0; isNodeOf(Current.get(), C::CAtom); ++Steps) {
    if (Steps == tl::MaxNativeNesting)
      tl::raise(PyExc_RuntimeError, "maximum recursion depth exceeded while dropping parentheses");
    NodeObject *N = node(Current.get());
    if (nodeGetChildCount(N) != 3 || !childTextIs(N, 0, "("))
      break;
    Ref Inner = nodeGetChild(N, 1);
    if (isNodeOf(Inner.get(), C::CTestListStarExpr) || isNodeOf(Inner.get(), C::CCompForNode))
      break;
    Current = std::move(Inner);
  }
  return Current;
}

Ref expandSeqLiteral(PyObject *Node, bool AnyBracket, bool DropParens) {
  Ref Current = DropParens ? dropSimpleParens(Node) : Ref::borrow(Node);
  if (!isNodeOf(Current.get(), C::CAtom))
    return none();
  NodeObject *Atom = node(Current.get());
  if (!AnyBracket && !childTextIs(Atom, 0, "("))
    return none();
  Ref Result = tl::require(PyList_New(0));
  if (nodeGetChildCount(Atom) == 2)
    return Result;
  Ref Inner = nodeGetChild(Atom, 1);
  if (!isNodeOf(Inner.get(), C::CTestListStarExpr)) {
    tl::requireStatus(PyList_Append(Result.get(), Inner.get()));
    return Result;
  }
  Py_ssize_t Count = exprGetSubExprCount(node(Inner.get()));
  for (Py_ssize_t I = 0; I < Count; ++I)
    tl::requireStatus(PyList_Append(Result.get(), exprGetSubExpr(node(Inner.get()), I).get()));
  return Result;
}

QuoteSplit splitPyQuotes(const char *Text, std::size_t Size) {
  auto IsLetter = [](char Ch) {
    switch (Ch) {
    case 'r':
    case 'R':
    case 'b':
    case 'B':
    case 'u':
    case 'U':
    case 'f':
    case 'F': return true;
    default: return false;
    }
  };
  std::size_t Letters = 0;
  while (Letters < Size && IsLetter(Text[Letters]))
    ++Letters;
  const char *Rest = Text + Letters;
  std::size_t RestSize = Size - Letters;
  if (RestSize < 2 || (Rest[0] != '"' && Rest[0] != '\'') || Rest[RestSize - 1] != Rest[0])
    return {0, 0};
  if (RestSize >= 6 && Rest[1] == Rest[0] && Rest[2] == Rest[0]) {
    if (Rest[RestSize - 3] == Rest[0] && Rest[RestSize - 2] == Rest[0])
      return {Letters + 3, 3};
    return {0, 0};
  }
  return {Letters + 1, 1};
}

Ref stripPyQuotes(PyObject *Txt) {
  tl::expectType(PyString_Check(Txt), "bytes", Txt);
  const char *S = PyString_AS_STRING(Txt);
  std::size_t Size = static_cast<std::size_t>(PyString_GET_SIZE(Txt));
  QuoteSplit Split = splitPyQuotes(S, Size);
  if (Split.PrefixLen == 0)
    return tl::require(Py_BuildValue("(Oss)", Txt, "", ""));
  Ref Body =
      tl::require(PyString_FromStringAndSize(S + Split.PrefixLen, Size - Split.PrefixLen - Split.SuffixLen));
  Ref Prefix = tl::require(PyString_FromStringAndSize(S, Split.PrefixLen));
  Ref Suffix = tl::require(PyString_FromStringAndSize(S + Size - Split.SuffixLen, Split.SuffixLen));
  return tl::require(PyTuple_Pack(3, Body.get(), Prefix.get(), Suffix.get()));
}

// ---- Python surface ----

namespace {

/// Checks a Python argument typed as the node class Cls (None accepted unless NoneOk is false).
void checkNodeArg(PyObject *Arg, const char *ArgName, NodeClass Cls, bool NoneOk) {
  if ((NoneOk && Arg == Py_None) || isNodeOf(Arg, Cls))
    return;
  raiseArgType(ArgName, nodeType(Cls).tp_name, Arg);
}

PyObject *util_GetTokenEndIndex(PyObject *, PyObject *Node) {
  return tl::guard<PyObject *>(nullptr, [&] {
    checkNodeArg(Node, "node", C::CNode, false);
    Py_ssize_t End = getTokenEndIndex(Node);
    if (End == -2 && PyErr_Occurred())
      throw tl::PyErrSet();
    return PyInt_FromSsize_t(End);
  });
}

template <bool (*Test)(PyObject *)> PyObject *atomTest(PyObject *, PyObject *Atom) {
  return tl::guard<PyObject *>(nullptr, [&] {
    checkNodeArg(Atom, "atom_node", C::CAtom, true);
    return pyBool(Test(Atom));
  });
}

PyObject *util_DropSimpleParens(PyObject *, PyObject *Node) {
  return tl::guard<PyObject *>(nullptr, [&] {
    checkNodeArg(Node, "node", C::CNode, true);
    return dropSimpleParens(Node).release();
  });
}

PyObject *util_StripPyQuotes(PyObject *, PyObject *Txt) {
  return tl::guard<PyObject *>(nullptr, [&] { return stripPyQuotes(Txt).release(); });
}

// _NativeOnly(name, *args): calls one of the module-level operations native
// code reaches but Python does not, so that tests can check them (the node
// classes' native-only operations: _CallNativeNodeOp).
PyObject *util_NativeOnly(PyObject *, PyObject *Args) {
  return tl::guard<PyObject *>(nullptr, [&]() -> PyObject * {
    const char *Name;
    PyObject *A = nullptr, *B = nullptr, *D = nullptr;
    if (!PyArg_ParseTuple(Args, "sO|OO:_NativeOnly", &Name, &A, &B, &D))
      throw tl::PyErrSet();
    auto Index = [&](PyObject *O) {
      if (!O)
        tl::raise(PyExc_TypeError, "an index is required");
      return indexArg(O);
    };
    std::string Op = Name;
    if (Op == "ExpandSeqLiteral")
      return expandSeqLiteral(A, B && tl::requireStatus(PyObject_IsTrue(B)),
                              !D || tl::requireStatus(PyObject_IsTrue(D)))
          .release();
    if (Op == "NextNonRemovedTokenInLogical")
      return tl::Ref::borrow(nextNonRemovedTokenInLogical(A, Index(B))).release();
    if (Op == "NextNonRemovedTokenInList")
      return tl::Ref::borrow(nextNonRemovedTokenInList(A, Index(B))).release();
    tl::raiseFormat(PyExc_ValueError, "no native-only operation %.100s", Name);
  });
}

} // namespace

PyMethodDef NodeUtilFunctions[] = {
    {"GetTokenEndIndex", util_GetTokenEndIndex, METH_O,
     "GetTokenEndIndex(node) -> int: the token end index for node (one past its last token)"},
    {"IsSetLiteral", atomTest<isSetLiteral>, METH_O,
     "IsSetLiteral(atom_node) -> bool: Returns whether atom is clearly a set literal."},
    {"IsGenExpression", atomTest<isGenExpression>, METH_O,
     "IsGenExpression(atom_node) -> bool: a parenthesised generator expression"},
    {"IsTupleExpression", atomTest<isTupleExpression>, METH_O,
     "IsTupleExpression(atom_node) -> bool: a parenthesised tuple, () included"},
    {"DropSimpleParens", util_DropSimpleParens, METH_O,
     "DropSimpleParens(node) -> node: the expression inside simple parentheses, else node itself"},
    {"StripPyQuotes", util_StripPyQuotes, METH_O,
     "StripPyQuotes(txt) -> (stripped, prefix, suffix): prefix + stripped + suffix == txt; prefix and "
     "suffix are empty unless txt is a complete string literal"},
    {"_NativeOnly", util_NativeOnly, METH_VARARGS,
     "_NativeOnly(name, *args): calls the native-only operation name (ExpandSeqLiteral, "
     "NextNonRemovedTokenInLogical, NextNonRemovedTokenInList); for tests"},
    {nullptr, nullptr, 0, nullptr}};

} // namespace treelens
