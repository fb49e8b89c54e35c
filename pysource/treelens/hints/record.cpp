// Hint parsing and recording: hint text to a tree of the hint parser, signature comments spread
// onto parameters and return value, and every hint recorded as a type equivalence of the logical.
#include "pysource/treelens/hints/hintsimpl.h"

#include "pysource/treelens/nodes/args.h"
#include "pysource/treelens/nodes/expr.h"
#include "pysource/treelens/nodes/nodehelp.h"
#include "pysource/treelens/nodes/stmt.h"
#include "pysource/treelens/nodes/totext.h"

#include <cstring>
#include <vector>

namespace treelens {
namespace hints {

using host::Host;
using host::LogicalLineObject;
using host::Sym;
using tl::Ref;
using namespace nodehelp;
using C = NodeClass;

HintConstants HK;

namespace {

ParserObject *hintParser(HW *W) {
  if (!W->HintParser)
    tl::raise(PyExc_ValueError, "CTypeHintWalker is not initialised");
  return W->HintParser;
}

/// Runs a parse; the parser's ParseError gives None, any other error propagates.
template <class F> Ref parseOrNone(F &&Parse) {
  Ref Result = Ref::steal(tl::guard<PyObject *>(nullptr, [&] { return Parse().release(); }));
  if (Result)
    return Result;
  if (PyErr_ExceptionMatches(Host.ParseError)) {
    PyErr_Clear();
    return none();
  }
  throw tl::PyErrSet();
}

/// A sub-expression count that is 0 for nodes that are not expressions.
Py_ssize_t subExprCount(PyObject *Node) {
  if (!isNodeOf(Node, C::CExpression))
    return 0;
  Py_ssize_t N = exprGetSubExprCount(node(Node));
  if (N < 0 && PyErr_Occurred())
    throw tl::PyErrSet();
  return N;
}

/// One C recursion level for the element-wise matching of sequence targets.
struct Nesting {
  Nesting() {
    if (Py_EnterRecursiveCall(const_cast<char *>(" while matching hints to targets")))
      throw tl::PyErrSet();
  }
  ~Nesting() { Py_LeaveRecursiveCall(); }
  Nesting(const Nesting &) = delete;
};

TextOptions dottedOnly() {
  TextOptions O;
  O.DottedNameOnly = true;
  return O;
}

/// The attribute of a record: read natively from an exact record, by name otherwise.
Ref argNamesOf(PyObject *Logical) {
  if (host::isLogical(Logical)) {
    PyObject *Names = reinterpret_cast<LogicalLineObject *>(Logical)->ArgNames;
    return Names ? Ref::borrow(Names) : tl::require(PyList_New(0));
  }
  return tl::require(PyObject_GetAttr(Logical, HK.ArgNamesAttr));
}

/// True when the record's parent scope is a class line.
bool inClassScope(PyObject *Logical) {
  Ref Parent;
  if (host::isLogical(Logical)) {
    PyObject *P = reinterpret_cast<LogicalLineObject *>(Logical)->ParentScope;
    if (!P)
      return false;
    Parent = Ref::borrow(P);
  } else {
    Parent = tl::require(PyObject_GetAttr(Logical, HK.ParentScopeAttr));
  }
  if (Parent.get() == Py_None)
    return false;
  if (host::isLogical(Parent.get()))
    return reinterpret_cast<LogicalLineObject *>(Parent.get())->Kind == 1;
  Ref Kind = tl::require(PyObject_GetAttr(Parent.get(), HK.KindAttr));
  long K = PyInt_AsLong(Kind.get());
  if (K == -1 && PyErr_Occurred())
    throw tl::PyErrSet();
  return K == 1;
}

bool isText(PyObject *T, const char *Lit) { return textIs(T, Lit); }

void append(PyObject *List, PyObject *Item) { tl::requireStatus(PyList_Append(List, Item)); }

} // namespace

Ref hintInfo(PyObject *Text) {
  tl::expectType(PyString_Check(Text), "bytes", Text);
  Ref Info = Ref::borrow(host::sym(Sym::kTypeHintPrefix));
  tl::expectType(PyString_Check(Info.get()), "bytes", Info.get());
  PyObject *Joined = Info.release();
  PyString_Concat(&Joined, Text);
  return tl::require(Joined);
}

void discardHint(HW *W, PyObject *Node) {
  if (!Node || Node == Py_None || !isNode(Node))
    return;
  PyObject *Type, *Value, *Tb;
  PyErr_Fetch(&Type, &Value, &Tb);
  if (!tl::guard<bool>(false, [&] {
        discardNode(hintParser(W), Node);
        return true;
      }))
    PyErr_WriteUnraisable(Node);
  PyErr_Restore(Type, Value, Tb);
}

// ---- Parsing ----

Ref parseHint(HW *W, PyObject *Hint) {
  tl::expectType(PyString_Check(Hint), "bytes", Hint);
  ParserObject *P = hintParser(W);
  Ref Logicals = tl::require(Host.Fast->SplitLogicals(PyString_AS_STRING(Hint), PyString_GET_SIZE(Hint)));
  if (!PyList_Check(Logicals.get()) || PyList_GET_SIZE(Logicals.get()) != 1)
    return none();
  Ref Logical = Ref::borrow(PyList_GET_ITEM(Logicals.get(), 0));
  if (!host::isLogical(Logical.get()))
    return none();
  Ref KeepParser = Ref::borrow(reinterpret_cast<PyObject *>(P));
  return parseOrNone([&] { return parseToNode(P, Logical.get(), false); });
}

Ref parseHintTokList(HW *W, PyObject *Tokens) {
  tl::expectType(PyList_Check(Tokens), "list", Tokens);
  ParserObject *P = hintParser(W);
  Ref KeepParser = Ref::borrow(reinterpret_cast<PyObject *>(P));
  return parseOrNone([&] { return parseTokenListToNode(P, Tokens, false); });
}

// A hint is an expression, or a lone token such as "...". Text that parses as a statement
// ("x = 1", "pass", "a; b") names no type: its tree goes back to the free lists.
Ref parsedHintExpression(HW *W, Ref Parsed) {
  PyObject *O = Parsed.get();
  if (O == Py_None || isNodeOf(O, C::CExpression))
    return Parsed;
  if (!isNode(O))
    tl::expectType(false, "CExpression", O);
  if (Py_TYPE(O) == &cnodeType() && node(O)->Text && node(O)->Text != Py_None)
    return Parsed;
  discardHint(W, O);
  return none();
}

void recordHintText(HW *W, PyObject *Target, PyObject *Hint, bool IsArg) {
  Ref HintNode = parsedHintExpression(W, parseHint(W, Hint));
  if (HintNode.get() == Py_None)
    return;
  bool Ok = tl::guard<bool>(false, [&] {
    processNameAndHintNodes(W, Target, HintNode.get(), IsArg);
    return true;
  });
  discardHint(W, HintNode.get());
  if (!Ok)
    throw tl::PyErrSet();
}

// SIGNATURE: '(' [TYPE (',' TYPE)*] ')' '->' TYPE, rewritten to
//   'def' 'function' '(' 'a' ':' TYPE (',' 'a' ':' TYPE)* ')' '->' TYPE ':'
// "(...)" gives no parameters; "*T" and "**T" become "*a : T" and "**a : T". Only positions count,
// so every parameter has the same dummy name.
Ref rewriteFuncdefCommentHint(PyObject *Hint) {
  tl::expectType(PyString_Check(Hint), "bytes", Hint);
  Ref Head = tl::require(Host.Fast->Tokenize("def function", 12));
  Ref Body = tl::require(Host.Fast->Tokenize(PyString_AS_STRING(Hint), PyString_GET_SIZE(Hint)));
  Ref Tail = tl::require(Host.Fast->Tokenize(":", 1));
  std::vector<PyObject *> Toks; // borrowed from the three lists
  for (PyObject *List : {Head.get(), Body.get(), Tail.get()})
    for (Py_ssize_t I = 0; I < PyList_GET_SIZE(List); ++I)
      Toks.push_back(PyList_GET_ITEM(List, I));
  Ref Out = tl::require(PyList_New(0));
  long Depth = 0, Paren = 0;
  for (std::size_t I = 0; I < Toks.size(); ++I) {
    PyObject *T = Toks[I];
    if (isText(T, "(")) {
      ++Depth, ++Paren;
    } else if (isText(T, ")")) {
      --Depth, --Paren;
    } else if (isText(T, "[") || isText(T, "{")) {
      ++Depth;
    } else if (isText(T, "}") || isText(T, "]")) {
      --Depth;
    } else if (Paren == 1 && Depth == 1 && I > 0) {
      PyObject *Prev = Toks[I - 1];
      if (isText(T, "...") && isText(Prev, "(") && I + 1 < Toks.size() && isText(Toks[I + 1], ")"))
        continue;
      if (isText(Prev, "(") || isText(Prev, ",")) {
        bool Star = isText(T, "*") || isText(T, "**");
        if (Star)
          append(Out.get(), T);
        append(Out.get(), HK.DummyName);
        append(Out.get(), HK.Colon);
        if (Star)
          continue;
      }
    }
    append(Out.get(), T);
  }
  return Out;
}

// ---- Recording ----

void addSymInfo(HW *W, PyObject *Name, PyObject *IStr, bool IsArg) {
  Ref Logical = Ref::borrow(logicalOf(W));
  if (!IsArg && host::isLogical(Logical.get()))
    tl::requireStatus(Host.Fast->AppendTypeEquiv(Logical.get(), Name, IStr));
  else
    tl::callMethod(Logical.get(), IsArg ? HK.AppendArgTypeEquiv : HK.AppendTypeEquiv, Name, IStr);
}

Ref getHintInfoStr(HW *W, PyObject *Node) {
  if (Node == Py_None)
    return none();
  Ref Text = isNodeOf(Node, C::CStringLiteral) ? stringGetStringContents(node(Node)) : textForNode(W->HintConv, Node);
  if (Text.get() == Py_None)
    return Text;
  return hintInfo(Text.get());
}

void processNameAndHintNodes(HW *W, PyObject *NameNode, PyObject *HintNode, bool IsArg) {
  if (NameNode == Py_None || HintNode == Py_None)
    return;
  if (!isNode(NameNode))
    raiseCannotConvert(NameNode, nodeType(C::CExpression));
  if (!isNode(HintNode))
    raiseCannotConvert(HintNode, nodeType(C::CExpression));
  Py_ssize_t N = subExprCount(NameNode);
  if (N != 0) {
    // A sequence target takes a sequence hint element by element; surplus elements on either side
    // are ignored.
    Nesting Level;
    Py_ssize_t M = subExprCount(HintNode);
    for (Py_ssize_t I = 0; I < N && I < M; ++I) {
      Ref SubName = exprGetSubExpr(node(NameNode), I);
      Ref SubHint = exprGetSubExpr(node(HintNode), I);
      processNameAndHintNodes(W, SubName.get(), SubHint.get(), IsArg);
    }
    return;
  }
  Ref Name = textForNode(W->NameConv, NameNode, dottedOnly());
  if (Name.get() == Py_None)
    return;
  Ref Text = textForNode(W->HintConv, HintNode);
  if (Text.get() == Py_None)
    return;
  addSymInfo(W, Name.get(), hintInfo(Text.get()).get(), IsArg);
}

void processFuncdefComment(HW *W, PyObject *Hint, PyObject *FuncdefLogical, bool IsArg) {
  Ref Tokens = rewriteFuncdefCommentHint(Hint);
  Ref Node = parseHintTokList(W, Tokens.get());
  if (Node.get() == Py_None)
    return;
  if (!isNodeOf(Node.get(), C::CFuncdefStmt)) {
    discardHint(W, Node.get());
    return;
  }
  bool Ok = tl::guard<bool>(false, [&] {
    NodeObject *N = node(Node.get());
    Ref List = getDefiningArgInfoList(funcdefGetParameters(N).get());
    tl::expectType(PyList_Check(List.get()), "list", List.get());
    std::vector<Ref> Args;
    for (Py_ssize_t I = 0; I < PyList_GET_SIZE(List.get()); ++I) {
      PyObject *Item = PyList_GET_ITEM(List.get(), I);
      if (PyObject_TypeCheck(Item, &argInfoType()))
        Args.push_back(Ref::borrow(Item));
    }
    Ref Names;
    Py_ssize_t Offset = 0, NameCount = 0;
    if (FuncdefLogical != Py_None) {
      Names = argNamesOf(FuncdefLogical);
      NameCount = PySequence_Size(Names.get());
      if (NameCount < 0)
        throw tl::PyErrSet();
      // A method's comment leaves out self or cls: one type fewer than parameters in a class.
      if (static_cast<Py_ssize_t>(Args.size()) + 1 == NameCount && inClassScope(FuncdefLogical))
        Offset = 1;
    }
    for (std::size_t I = 0; I < Args.size(); ++I) {
      auto *A = reinterpret_cast<ArgInfoObject *>(Args[I].get());
      if (!A->TypeExpr || A->TypeExpr == Py_None)
        continue;
      Ref TypeExpr = Ref::borrow(A->TypeExpr);
      Ref Name;
      if (FuncdefLogical == Py_None) {
        Ref Index = tl::require(PyInt_FromSsize_t(static_cast<Py_ssize_t>(I)));
        Name = tl::require(PyObject_CallFunctionObjArgs(HK.BuildArgInfo, Index.get(), Py_None, nullptr));
      } else {
        // Types beyond the def's parameters name nothing and are ignored.
        Py_ssize_t At = static_cast<Py_ssize_t>(I) + Offset;
        if (At >= NameCount)
          break;
        Name = tl::require(PySequence_GetItem(Names.get(), At));
      }
      Ref Text = textForNode(W->HintConv, TypeExpr.get());
      if (Text.get() != Py_None)
        addSymInfo(W, Name.get(), hintInfo(Text.get()).get(), IsArg);
    }
    Ref Info = getHintInfoStr(W, funcdefGetReturnType(N).get());
    if (Info.get() != Py_None)
      addSymInfo(W, HK.Return, Info.get(), IsArg);
    return true;
  });
  discardHint(W, Node.get());
  if (!Ok)
    throw tl::PyErrSet();
}

void visitFuncdefStmt(HW *W, PyObject *Node) {
  if (!isNodeOf(Node, C::CFuncdefStmt))
    raiseCannotConvert(Node, nodeType(C::CFuncdefStmt));
  NodeObject *N = node(Node);
  Ref List = getDefiningArgInfoList(funcdefGetParameters(N).get());
  tl::expectType(PyList_Check(List.get()), "list", List.get());
  // A line without type comments has no per-parameter or signature comment to look for.
  bool Comments = W->CommentHintCount != 0;
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(List.get()); ++I) {
    Ref Item = Ref::borrow(PyList_GET_ITEM(List.get(), I));
    if (!PyObject_TypeCheck(Item.get(), &argInfoType()))
      continue;
    auto *A = reinterpret_cast<ArgInfoObject *>(Item.get());
    if (A->TypeExpr && A->TypeExpr != Py_None) {
      Ref Name = Ref::borrow(A->Name ? A->Name : Py_None), TypeExpr = Ref::borrow(A->TypeExpr);
      processNameAndHintNodes(W, Name.get(), TypeExpr.get(), true);
    } else if (Comments && A->Name && A->Name != Py_None) {
      processArgSpecificComment(W, Item.get());
    }
  }
  Ref Info = getHintInfoStr(W, funcdefGetReturnType(N).get());
  if (Info.get() != Py_None)
    addSymInfo(W, HK.Return, Info.get(), true);
  if (!Comments)
    return;
  Ref Hint = findEndingTypeComment(W, Node);
  if (Hint.get() == Py_None)
    return;
  tl::expectType(PyString_Check(Hint.get()), "bytes", Hint.get());
  Ref Logical = Ref::borrow(logicalOf(W));
  processFuncdefComment(W, Hint.get(), Logical.get(), true);
}

void initHintConstants() {
  HK.Return = tl::internName("return");
  HK.AppendTypeEquiv = tl::internName("AppendTypeEquiv");
  HK.AppendArgTypeEquiv = tl::internName("AppendArgTypeEquiv");
  HK.ArgNamesAttr = tl::internName("fArgNames");
  HK.ParentScopeAttr = tl::internName("fParentScope");
  HK.KindAttr = tl::internName("fKind");
  HK.DummyName = tl::internName("a");
  HK.Colon = tl::internName(":");
  Ref SymbolInfo = tl::require(PyImport_ImportModule("pysource.symbolinfo"));
  HK.BuildArgInfo = tl::require(PyObject_GetAttrString(SymbolInfo.get(), "BuildArgInfo")).release();
}

} // namespace hints
} // namespace treelens
