// The symbol walker's handlers: names read and bound, assignment targets, imports, definitions,
// calls and the type equivalences recorded for them.
#include "pysource/treelens/front/front.h"
#include "pysource/treelens/host/host.h"
#include "pysource/treelens/nodes/args.h"
#include "pysource/treelens/nodes/expr.h"
#include "pysource/treelens/nodes/nodehelp.h"
#include "pysource/treelens/nodes/records.h"
#include "pysource/treelens/nodes/stmt.h"
#include "pysource/treelens/nodes/totext.h"
#include "pysource/treelens/nodes/utils.h"
#include "pysource/treelens/walker/walkerimpl.h"

#include <cstring>
#include <initializer_list>
#include <string>

namespace treelens {
namespace walker {

using host::Host;
using host::Sym;
using host::sym;
using tl::Ref;
using namespace nodehelp;
using C = NodeClass;

WalkerConstants K;

namespace {

PyObject *moduleConstant(const char *Name) {
  PyObject *V = PyDict_GetItemString(Host.ModuleDict, Name);
  if (!V || !PyString_Check(V))
    tl::raiseFormat(PyExc_ImportError, "pysource.treelens: constant %s is missing", Name);
  Py_INCREF(V);
  return V;
}

/// The concatenation of byte strings (TypeError for anything else).
Ref concat(std::initializer_list<PyObject *> Parts) {
  Py_ssize_t Size = 0;
  for (PyObject *P : Parts) {
    tl::expectType(PyString_Check(P), "bytes", P);
    Size += PyString_GET_SIZE(P);
  }
  Ref Out = tl::require(PyString_FromStringAndSize(nullptr, Size));
  char *Dst = PyString_AS_STRING(Out.get());
  for (PyObject *P : Parts) {
    std::memcpy(Dst, PyString_AS_STRING(P), PyString_GET_SIZE(P));
    Dst += PyString_GET_SIZE(P);
  }
  return Out;
}

Ref bytes(const char *S) { return tl::require(PyString_FromString(S)); }
Ref bytes(const std::string &S) {
  return tl::require(PyString_FromStringAndSize(S.data(), static_cast<Py_ssize_t>(S.size())));
}

bool isNone(const Ref &R) { return R.get() == Py_None; }

/// The record being walked, or None when the walker is idle.
PyObject *logical(NW *W) { return W->Logical ? W->Logical : Py_None; }

NodeObject *asNodeOf(PyObject *O, C Class) {
  if (!isNodeOf(O, Class))
    raiseCannotConvert(O, nodeType(Class));
  return node(O);
}

NodeObject *asAnyNode(PyObject *O) {
  if (!isNode(O))
    raiseCannotConvert(O, cnodeType());
  return node(O);
}

PyObject *asList(PyObject *O) {
  tl::expectType(PyList_Check(O), "list", O);
  return O;
}

PyObject *dictField(PyObject *D, const char *Name) {
  if (!D || !PyDict_Check(D))
    tl::raiseFormat(PyExc_TypeError, "CNodeWalker.%s is not a dict", Name);
  return D;
}

ArgInfoObject *asArgInfo(PyObject *O) {
  if (!PyObject_TypeCheck(O, &argInfoType()))
    raiseCannotConvert(O, argInfoType());
  return reinterpret_cast<ArgInfoObject *>(O);
}

/// A field of a CArgInfo as a new reference, None for NULL.
Ref field(PyObject *F) { return Ref::borrow(F ? F : Py_None); }

Ref text(NW *W, PyObject *Node, TextOptions O = TextOptions()) { return textForNode(W->ToText, Node, O); }

TextOptions dottedOnly() {
  TextOptions O;
  O.DottedNameOnly = true;
  return O;
}

bool isTextOf(PyObject *Text, PyObject *Other) {
  return PyString_Check(Text) && PyString_Check(Other) && PyString_GET_SIZE(Text) == PyString_GET_SIZE(Other) &&
         std::memcmp(PyString_AS_STRING(Text), PyString_AS_STRING(Other), PyString_GET_SIZE(Text)) == 0;
}

bool isLiteralNameText(PyObject *Text) {
  return textIs(Text, "None") || textIs(Text, "True") || textIs(Text, "False");
}

/// The decimal text of a node's token index.
Ref contextText(NodeObject *N) { return tl::require(PyObject_Str(N->Context ? N->Context : Py_None)); }

Py_ssize_t contextIndex(NodeObject *N) {
  if (!N->Context)
    tl::raise(PyExc_TypeError, "node has no token index");
  return indexArg(N->Context);
}

// ---- Record operations. The module functions go through the host's native
// table; the record's methods are called natively for an exact record and by
// name otherwise, so a host record class with its own methods is honoured.

void appendLogicalAttrib(NW *W, PyObject *Attrib) {
  tl::requireStatus(Host.Fast->AppendAttrib(logical(W), Attrib));
}

void appendLogicalTypeEquiv(NW *W, PyObject *Name, PyObject *Info) {
  tl::requireStatus(Host.Fast->AppendTypeEquiv(logical(W), Name, Info));
}

void recordTypeEquiv(NW *W, PyObject *Name, PyObject *Info) {
  PyObject *L = logical(W);
  if (host::isLogical(L))
    tl::requireStatus(Host.Fast->AppendTypeEquiv(L, Name, Info));
  else
    tl::callMethod(L, K.AppendTypeEquiv, Name, Info);
}

template <class... A> void recordMethod(NW *W, PyObject *Method, A... Args) {
  Ref Keep = Ref::borrow(logical(W));
  tl::callMethod(Keep.get(), Method, Args...);
}

/// Saves the context fields and restores them when the scope ends, also on error.
struct ContextSave {
  NW *W;
  bool Load, Within;
  explicit ContextSave(NW *Walker) : W(Walker), Load(Walker->LoadNameContext), Within(Walker->StoreWithinSubExpr) {}
  ~ContextSave() {
    W->LoadNameContext = Load;
    W->StoreWithinSubExpr = Within;
  }
};

/// One C recursion level for the handlers that recurse on their own.
struct Nesting {
  explicit Nesting(const char *Where) {
    if (Py_EnterRecursiveCall(const_cast<char *>(Where)))
      throw tl::PyErrSet();
  }
  ~Nesting() { Py_LeaveRecursiveCall(); }
  Nesting(const Nesting &) = delete;
};

bool isSequenceTarget(PyObject *O) { return isNodeOf(O, C::CTestListStarExpr) || isNodeOf(O, C::CAtom); }

/// The host's literal info, built here: kTypedLiteralPrefix, the kind and ":", then " " and the
/// literal's text unless it has none.
Ref buildLiteralInfo(PyObject *Kind, PyObject *Text) {
  if (Text == Py_None)
    return concat({sym(Sym::kTypedLiteralPrefix), Kind, K.Colon});
  return concat({sym(Sym::kTypedLiteralPrefix), Kind, K.ColonBlank, Text});
}

/// Calls Record with "<class>" + kInstanceSuffix for the class a node names
/// (`except E`, `isinstance(x, C)`), or for each dotted element of a tuple of
/// classes (`(A, b.B)`); elements that are no dotted names are skipped.
template <class F> void forEachInstanceInfo(NW *W, PyObject *Classes, F &&Record) {
  PyObject *Suffix = PyDict_GetItemString(Host.ModuleDict, "kInstanceSuffix");
  if (!Suffix)
    tl::raise(PyExc_NameError, "global name 'kInstanceSuffix' is not defined");
  Ref KeepSuffix = Ref::borrow(Suffix);
  Ref ClassText = text(W, Classes, dottedOnly());
  if (!isNone(ClassText)) {
    Record(concat({ClassText.get(), Suffix}).get());
    return;
  }
  Ref Elements = expandSeqLiteral(Classes, true);
  if (isNone(Elements))
    return;
  asList(Elements.get());
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Elements.get()); ++I) {
    Ref Element = Ref::borrow(PyList_GET_ITEM(Elements.get(), I));
    Ref ElementText = text(W, Element.get(), dottedOnly());
    if (!isNone(ElementText))
      Record(concat({ElementText.get(), Suffix}).get());
  }
}

} // namespace

void initWalkerConstants() {
  K.Empty = tl::internName("");
  K.ListInstance = moduleConstant("kListInstanceName");
  K.DictInstance = moduleConstant("kDictInstanceName");
  K.TupleInstance = moduleConstant("kTupleInstanceName");
  K.StringInstance = moduleConstant("kStringInstanceName");
  K.UnicodeInstance = moduleConstant("kUnicodeInstanceName");
  PyObject *Prefix = sym(Sym::kTypedLiteralPrefix);
  K.NoneLiteral = concat({Prefix, bytes("None: None").get()}).release();
  K.TrueLiteral = concat({Prefix, bytes("bool: True").get()}).release();
  K.FalseLiteral = concat({Prefix, bytes("bool: False").get()}).release();
  K.IntPrefixOnly = concat({Prefix, bytes("int:").get()}).release();
  K.FloatPrefixOnly = concat({Prefix, bytes("float:").get()}).release();
  K.KindSet = tl::internName("set");
  K.KindDict = tl::internName("dict");
  K.KindInt = tl::internName("int");
  K.KindFloat = tl::internName("float");
  K.Isinstance = tl::internName("isinstance");
  K.Colon = tl::internName(":");
  K.ColonBlank = tl::internName(": ");
  K.Semicolon = tl::internName(";");
  K.Blank = tl::internName(" ");
  K.Star = tl::internName("*");
  K.BlankStar = tl::internName(" *");
  K.Return = tl::internName("return");
  K.Yield = tl::internName("yield");
  K.FromBlank = tl::internName("from ");
  K.MimicName = tl::internName("kMimicAstInspectBugs");
  K.AppendTypeEquiv = tl::internName("AppendTypeEquiv");
  K.AppendArgName = tl::internName("AppendArgName");
  K.AppendArgTypeEquiv = tl::internName("AppendArgTypeEquiv");
  K.AppendBaseClassName = tl::internName("AppendBaseClassName");
  K.GenExprMessage = tl::internName("Generator expression must be parenthesized if not sole argument");
  K.ExceptNameMessage = tl::internName("Name in except clause must be a simple name");
}

// ---- Names, targets and assignments ----

void visitStoreContextNode(NW *W, PyObject *Node, bool WithinSubExpr) {
  ContextSave Saved(W);
  W->LoadNameContext = false;
  W->StoreWithinSubExpr = WithinSubExpr;
  visitNode(W, Node);
}

void visitLoadContextNode(NW *W, PyObject *Node) {
  ContextSave Saved(W);
  W->LoadNameContext = true;
  visitNode(W, Node);
}

namespace {

/// Appends Name to the walk's order list *Order, making the list first.
void noteOrder(PyObject **Order, PyObject *Name) {
  if (!*Order || !PyList_Check(*Order))
    Py_XSETREF(*Order, tl::require(PyList_New(0)).release());
  tl::requireStatus(PyList_Append(*Order, Name));
}

} // namespace

void processLoadName(NW *W, PyObject *Name) {
  PyObject *Loaded = dictField(W->LoadedNames, "_fLoadedNames");
  if (tl::requireStatus(PyDict_Contains(Loaded, Name)))
    return;
  tl::requireStatus(PyDict_SetItem(Loaded, Name, K.Empty));
  noteOrder(&W->LoadedOrder, Name);
}

namespace {

/// visitNameLiteral; Rendered, when given, is the text of the atom with its
/// first TrailerI + 1 trailers, already known to the caller.
void visitName(NW *W, PyObject *Node, PyObject *Atom, PyObject *AllTrailers, Py_ssize_t TrailerI,
               const std::string *Rendered) {
  NodeObject *N = asAnyNode(Node);
  Ref Name = field(N->Text);
  if (!PyString_Check(Name.get()) || isLiteralNameText(Name.get()))
    return;
  bool Load = false;
  if (AllTrailers != Py_None) {
    asList(AllTrailers);
    if (TrailerI >= 0 && Rendered) {
      Name = bytes(*Rendered);
    } else if (TrailerI >= 0) {
      Ref Leading = tl::require(PyList_GetSlice(AllTrailers, 0, TrailerI + 1));
      Name = textForAtomPlusTrailers(W->ToText, Atom, Leading.get());
      if (isNone(Name))
        return;
    }
    Load = TrailerI + 1 < PyList_GET_SIZE(AllTrailers);
  }
  if (W->LoadNameContext || Load) {
    processLoadName(W, Name.get());
  } else if (W->StoreWithinSubExpr) {
    Ref Info = concat({sym(Sym::kWithinExprPrefix), contextText(N).get()});
    PyObject *Stored = dictField(W->StoredNames, "_fStoredNames");
    Ref Old = Ref::borrow(PyDict_GetItem(Stored, Name.get()));
    if (Old) {
      Info = concat({Old.get(), K.Semicolon, Info.get()});
    }
    tl::requireStatus(PyDict_SetItem(Stored, Name.get(), Info.get()));
    if (!Old)
      noteOrder(&W->StoredOrder, Name.get());
  }
}

} // namespace

void visitNameLiteral(NW *W, PyObject *Node, PyObject *Atom, PyObject *AllTrailers, Py_ssize_t TrailerI) {
  visitName(W, Node, Atom, AllTrailers, TrailerI, nullptr);
}

void visitDottedName(NW *W, PyObject *Node) {
  NodeObject *N = asAnyNode(Node);
  Ref Children = field(N->Children);
  if (!PyList_Check(Children.get()))
    return;
  std::string Text;
  // Parts and dots alternate: the prefixes of the first kMaxChainPrefixes + 1 parts are read.
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Children.get()) && I <= 2 * kMaxChainPrefixes; ++I) {
    Ref Child = Ref::borrow(PyList_GET_ITEM(Children.get(), I));
    PyObject *Piece = asAnyNode(Child.get())->Text;
    if (!Piece || !PyString_Check(Piece))
      tl::raise(PyExc_TypeError, "dotted name part has no text");
    Text.append(PyString_AS_STRING(Piece), PyString_GET_SIZE(Piece));
    if (I % 2 == 0)
      processLoadName(W, bytes(Text).get());
  }
}

void visitCompForNode(NW *W, PyObject *Node) {
  NodeObject *N = asNodeOf(Node, C::CCompForNode);
  visitStoreContextNode(W, compForGetTargetNode(N).get(), true);
  visitNode(W, compForGetInNode(N).get());
  Ref Iter = compForGetCompIterNode(N);
  if (!isNone(Iter))
    visitNode(W, Iter.get());
}

void visitExprStmt(NW *W, PyObject *Node) {
  NodeObject *N = asNodeOf(Node, C::CExprStmt);
  if (!isNone(exprStmtGetAnnotatedAssignNode(N)))
    visitAnnotatedAssign(W, Node);
  else if (exprStmtGetEqualCount(N) != 0)
    visitAssignment(W, Node);
  else if (!isNone(exprStmtGetAugAssignOp(N)))
    visitAugAssign(W, Node);
  else
    visitChildren(W, Node);
}

void visitAssignment(NW *W, PyObject *Node) {
  NodeObject *N = asNodeOf(Node, C::CExprStmt);
  Py_ssize_t Count = exprStmtGetEqualCount(N);
  if (Count == 0) {
    visitChildren(W, Node);
    return;
  }
  Ref Value = exprStmtGetPostEqualsTestExpr(N, Count - 1);
  for (Py_ssize_t I = -1; I < Count - 1; ++I) {
    Ref Target = I < 0 ? exprStmtGetInitialTestExpr(N) : exprStmtGetPostEqualsTestExpr(N, I);
    processTargets(W, Target.get(), Value.get());
    visitStoreContextNode(W, Target.get(), false);
  }
  visitNode(W, Value.get());
}

void visitAugAssign(NW *W, PyObject *Node) {
  NodeObject *N = asNodeOf(Node, C::CExprStmt);
  PyObject *Mimic = PyDict_GetItem(Host.ModuleDict, K.MimicName);
  if (!Mimic)
    tl::raiseFormat(PyExc_NameError, "global name '%s' is not defined", "kMimicAstInspectBugs");
  if (tl::isTrue(Ref::borrow(Mimic).get()))
    visitNode(W, nodeGetChild(N, 2).get());
  else
    visitChildren(W, Node);
}

void visitAnnotatedAssign(NW *W, PyObject *Node) {
  NodeObject *N = asNodeOf(Node, C::CExprStmt);
  Ref Target = exprStmtGetInitialTestExpr(N);
  visitStoreContextNode(W, Target.get(), false);
  Ref Ann = exprStmtGetAnnotatedAssignNode(N);
  if (isNone(Ann))
    return;
  visitNode(W, Ann.get());
  Ref Value = annAssignGetPostEqualsTestExpr(asAnyNode(Ann.get()));
  if (!isNone(Value))
    processTargets(W, Target.get(), Value.get());
}

void visitForStmt(NW *W, PyObject *Node) {
  NodeObject *N = asNodeOf(Node, C::CForStmt);
  Ref Target = forStmtGetTarget(N);
  Ref Seq = forStmtGetInExpression(N);
  visitStoreContextNode(W, Target.get(), false);
  visitNode(W, Seq.get());
  if (isNodeOf(Target.get(), C::CNameLiteral))
    appendSubscriptedEquivNode(W, Target.get(), Seq.get(), -1);
  else
    processTargets(W, Target.get(), Py_None);
  visitNode(W, forStmtGetBody(N).get());
  Ref Else = forStmtGetElseBody(N);
  if (!isNone(Else))
    visitNode(W, Else.get());
}

// A with item binds its target like an assignment and reads its expression:
// `with open(p) as self.f:` reads open, p and self.
void visitWithItem(NW *W, PyObject *Node) {
  NodeObject *N = asNodeOf(Node, C::CWithItem);
  Ref Expression = withItemGetExpression(N);
  Ref Target = withItemGetTarget(N);
  if (!isNone(Target))
    processTargets(W, Target.get(), Expression.get());
  visitLoadContextNode(W, Expression.get());
  if (!isNone(Target))
    visitStoreContextNode(W, Target.get(), false);
}

namespace {

/// `Target := Value`: binds the target in the line's scope as an assignment
/// does, also inside a comprehension (the language binds it in the enclosing
/// scope), and reads the value.
void bindNamedExpr(NW *W, PyObject *Target, PyObject *Value) {
  appendEquivNode(W, Target, Value);
  visitLoadContextNode(W, Value);
}

} // namespace

// namedexpr_test: test ':=' test (a single test is promoted to its child)
void visitNamedExpr(NW *W, PyObject *Node) {
  NodeObject *N = asNodeOf(Node, C::CNamedExpr);
  if (rawCount(N) != 3) {
    visitChildren(W, Node);
    return;
  }
  bindNamedExpr(W, obj(childAt(N, 0)), obj(childAt(N, 2)));
}

// argument: test ':=' test is an assignment expression; the other forms are
// read child by child.
void visitUsedArgument(NW *W, PyObject *Node) {
  NodeObject *N = asNodeOf(Node, C::CSingleUsedArgumentNode);
  if (rawCount(N) == 3 && childTextIs(N, 1, ":=")) {
    bindNamedExpr(W, obj(childAt(N, 0)), obj(childAt(N, 2)));
    return;
  }
  visitChildren(W, Node);
}

void processTargets(NW *W, PyObject *LhsIn, PyObject *Rhs) {
  // `(a) = 1` binds a: a parenthesized target is the target inside.
  Ref Dropped = isNodeOf(LhsIn, C::CAtom) ? dropSimpleParens(LhsIn) : Ref::borrow(LhsIn);
  PyObject *Lhs = Dropped.get();
  if (!isSequenceTarget(Lhs)) {
    appendEquivNode(W, Lhs, Rhs);
    return;
  }
  Nesting Level(" while recording assignment targets");
  NodeObject *L = node(Lhs);
  Py_ssize_t Count = exprGetSubExprCount(L);
  if (Count < 0 && PyErr_Occurred())
    throw tl::PyErrSet();
  bool PairValues = isSequenceTarget(Rhs);
  Py_ssize_t ValueCount = 0;
  if (PairValues) {
    ValueCount = exprGetSubExprCount(node(Rhs));
    if (ValueCount < 0 && PyErr_Occurred())
      throw tl::PyErrSet();
  }
  for (Py_ssize_t I = 0; I < Count; ++I) {
    Ref SubValue = PairValues && I < ValueCount ? exprGetSubExpr(node(Rhs), I) : none();
    Ref SubTarget = exprGetSubExpr(L, I);
    if (isNodeOf(SubTarget.get(), C::CStarExpression)) {
      Ref Starred = starGetStarredExpression(node(SubTarget.get()));
      Ref Name = isNone(Starred) ? none() : text(W, Starred.get());
      if (!isNone(Name)) {
        appendLogicalAttrib(W, Name.get());
        appendLogicalTypeEquiv(W, Name.get(), K.ListInstance);
      }
    } else {
      processTargets(W, SubTarget.get(), SubValue.get());
    }
  }
}

void appendEquivNode(NW *W, PyObject *NameNode, PyObject *EquivNode) {
  // An element that is no expression (`...` in a target list) names nothing.
  if (NameNode == Py_None)
    return;
  Ref Name = text(W, NameNode);
  if (isNone(Name))
    return;
  if (!std::memchr(PyString_AS_STRING(Name.get()), '[', PyString_GET_SIZE(Name.get())))
    appendLogicalAttrib(W, Name.get());
  if (EquivNode != Py_None) {
    Ref Equiv = typeEquivForNode(W, EquivNode, nullptr);
    if (!isNone(Equiv))
      appendLogicalTypeEquiv(W, Name.get(), Equiv.get());
  }
}

namespace {

/// Calls Emit(name, value) for each entry of the dict D: first the names of
/// Order that D holds, in that order, then any other keys (put there by a
/// caller, not the walk) sorted, so that the result never follows hashing.
/// Emit runs on a snapshot, so it may run Python code.
template <class F> void eachInOrder(PyObject *D, PyObject *Order, bool Checked, const char *Field, F &&Emit) {
  if (PyDict_Size(D) == 0)
    return;
  Ref Rest = tl::require(PyDict_Copy(D));
  Ref Items = tl::require(PyList_New(0));
  Ref Snapshot = Order && PyList_Check(Order) ? tl::require(PyList_GetSlice(Order, 0, PyList_GET_SIZE(Order)))
                                              : tl::require(PyList_New(0));
  auto take = [&](PyObject *Name) {
    PyObject *Value = PyDict_GetItem(Rest.get(), Name);
    if (!Value)
      return;
    Ref Pair = tl::require(PyTuple_Pack(2, Name, Value));
    tl::requireStatus(PyDict_DelItem(Rest.get(), Name));
    tl::requireStatus(PyList_Append(Items.get(), Pair.get()));
  };
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Snapshot.get()); ++I)
    take(PyList_GET_ITEM(Snapshot.get(), I));
  if (PyDict_Size(Rest.get())) {
    Ref Keys = tl::require(PyDict_Keys(Rest.get()));
    tl::requireStatus(PyList_Sort(Keys.get()));
    for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Keys.get()); ++I)
      take(PyList_GET_ITEM(Keys.get(), I));
  }
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Items.get()); ++I) {
    PyObject *Item = PyList_GET_ITEM(Items.get(), I);
    PyObject *Name = PyTuple_GET_ITEM(Item, 0);
    if (Checked && Name == Py_None)
      tl::raiseFormat(PyExc_AssertionError, "None name in %s", Field);
    Emit(Name, PyTuple_GET_ITEM(Item, 1));
  }
}

} // namespace

void processNamesFound(NW *W, PyObject *Node) {
  if (isNodeOf(Node, C::CImportNamesStmt) || isNodeOf(Node, C::CFromImportStmt))
    return;
  bool Checked = Py_OptimizeFlag == 0;
  PyObject *Loaded = dictField(W->LoadedNames, "_fLoadedNames");
  eachInOrder(Loaded, W->LoadedOrder, Checked, "_fLoadedNames",
              [&](PyObject *Name, PyObject *) { recordTypeEquiv(W, Name, sym(Sym::kGetPrefix)); });
  PyObject *StoredDict = dictField(W->StoredNames, "_fStoredNames");
  eachInOrder(StoredDict, W->StoredOrder, Checked, "_fStoredNames", [&](PyObject *Name, PyObject *Joined) {
    tl::expectType(PyString_Check(Joined), "bytes", Joined);
    const char *P = PyString_AS_STRING(Joined);
    const char *End = P + PyString_GET_SIZE(Joined);
    for (;;) {
      const char *Sep = static_cast<const char *>(std::memchr(P, ';', End - P));
      const char *PieceEnd = Sep ? Sep : End;
      Ref Piece = tl::require(PyString_FromStringAndSize(P, PieceEnd - P));
      recordTypeEquiv(W, Name, Piece.get());
      if (!Sep)
        break;
      P = Sep + 1;
    }
  });
}

// ---- Imports ----

namespace {

AsNameObject *asAsName(PyObject *O) {
  if (!PyObject_TypeCheck(O, &asNameType()))
    raiseCannotConvert(O, asNameType());
  return reinterpret_cast<AsNameObject *>(O);
}

/// The name an imported item binds: its alias, else its module name.
Ref boundName(AsNameObject *A) {
  Ref Name = field(A->AsName ? A->AsName : A->ModuleName);
  tl::expectType(PyString_Check(Name.get()), "bytes", Name.get());
  return Name;
}

void recordImported(NW *W, PyObject *Name, PyObject *Info) {
  Ref Pair = tl::require(PyTuple_Pack(2, Name, Info));
  appendLogicalAttrib(W, Pair.get());
  appendLogicalTypeEquiv(W, Name, Info);
}

} // namespace

void visitImportNames(NW *W, PyObject *Node) {
  Ref Items = importNamesGetAsNameList(asNodeOf(Node, C::CImportNamesStmt));
  asList(Items.get());
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Items.get()); ++I) {
    Ref Item = Ref::borrow(PyList_GET_ITEM(Items.get(), I));
    AsNameObject *A = asAsName(Item.get());
    Ref Name = boundName(A);
    Ref Info;
    const char *Dot = static_cast<const char *>(
        std::memchr(PyString_AS_STRING(Name.get()), '.', PyString_GET_SIZE(Name.get())));
    if (Dot) {
      Name = tl::require(PyString_FromStringAndSize(PyString_AS_STRING(Name.get()), Dot - PyString_AS_STRING(Name.get())));
      Info = concat({sym(Sym::kImportPrefix), Name.get()});
    } else {
      Ref Module = field(A->ModuleName);
      Info = concat({sym(Sym::kImportPrefix), Module.get()});
    }
    recordImported(W, Name.get(), Info.get());
    if (A->AsName)
      appendLogicalTypeEquiv(W, Name.get(), concat({sym(Sym::kImportAsNamePrefix), A->AsName}).get());
  }
}

void visitFromImport(NW *W, PyObject *Node) {
  NodeObject *N = asNodeOf(Node, C::CFromImportStmt);
  Ref From = fromImportGetFromString(N);
  if (!isNone(From))
    tl::expectType(PyString_Check(From.get()), "bytes", From.get());
  if (fromImportGetImportStar(N)) {
    appendLogicalTypeEquiv(W, K.Star, concat({sym(Sym::kFromImportPrefix), From.get(), K.BlankStar}).get());
    return;
  }
  Ref Items = fromImportGetAsNameList(N);
  asList(Items.get());
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Items.get()); ++I) {
    Ref Item = Ref::borrow(PyList_GET_ITEM(Items.get(), I));
    AsNameObject *A = asAsName(Item.get());
    Ref Name = boundName(A);
    Ref Module = field(A->ModuleName);
    Ref Info = concat({sym(Sym::kFromImportPrefix), From.get(), K.Blank, Module.get()});
    recordImported(W, Name.get(), Info.get());
    if (A->AsName)
      appendLogicalTypeEquiv(W, Name.get(), concat({sym(Sym::kImportAsNamePrefix), Name.get()}).get());
  }
}

// ---- Definitions and scopes ----

void visitFuncdef(NW *W, PyObject *Node) {
  NodeObject *N = asNodeOf(Node, C::CFuncdefStmt);
  visitTypeParamsOf(W, Node);
  Ref Params = funcdefGetParameters(N);
  if (isNone(Params))
    return;
  visitParameters(W, Params.get());
  Ref Returns = funcdefGetReturnType(N);
  if (!isNone(Returns))
    visitNode(W, Returns.get());
}

void visitParameters(NW *W, PyObject *Node) { processDefiningArgList(W, getDefiningArgInfoList(Node).get()); }

void processDefiningArgList(NW *W, PyObject *ArgList) {
  Ref List = Ref::borrow(asList(ArgList));
  Nesting Level(" while recording parameters");
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(List.get()); ++I) {
    Ref Item = Ref::borrow(PyList_GET_ITEM(List.get(), I));
    if (PyList_Check(Item.get())) {
      processDefiningArgList(W, Item.get());
      continue;
    }
    ArgInfoObject *A = asArgInfo(Item.get());
    Ref NameNode = field(A->Name), Value = field(A->Value), Prefix = field(A->Prefix), TypeExpr = field(A->TypeExpr);
    if (isNone(NameNode))
      continue;
    Ref Name = field(asAnyNode(NameNode.get())->Text);
    if (isNone(Name) && Py_OptimizeFlag == 0)
      tl::raise(PyExc_AssertionError, "parameter name has no text");
    recordMethod(W, K.AppendArgName, Name.get());
    Ref Info;
    if (!isNone(Value))
      Info = typeEquivForNode(W, Value.get(), nullptr);
    else if (textIs(Prefix.get(), "*"))
      Info = Ref::borrow(K.TupleInstance);
    else if (textIs(Prefix.get(), "**"))
      Info = Ref::borrow(K.DictInstance);
    if (Info && !isNone(Info))
      recordMethod(W, K.AppendArgTypeEquiv, Name.get(), Info.get());
    if (!isNone(Value))
      visitNode(W, Value.get());
    if (!isNone(TypeExpr))
      visitNode(W, TypeExpr.get());
  }
}

void visitLambdaExpr(NW *W, PyObject *Node) {
  NodeObject *N = asNodeOf(Node, C::CLambdaExpr);
  Ref Args = lambdaGetArgumentsNode(N);
  if (!isNone(Args))
    processLambdaDefiningArgList(W, getDefiningArgInfoList(Args.get()).get());
  visitNode(W, lambdaGetBodyExpr(N).get());
}

void processLambdaDefiningArgList(NW *W, PyObject *ArgList) {
  Ref List = Ref::borrow(asList(ArgList));
  Nesting Level(" while recording lambda parameters");
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(List.get()); ++I) {
    Ref Item = Ref::borrow(PyList_GET_ITEM(List.get(), I));
    if (PyList_Check(Item.get())) {
      processLambdaDefiningArgList(W, Item.get());
      continue;
    }
    ArgInfoObject *A = asArgInfo(Item.get());
    Ref NameNode = field(A->Name), Value = field(A->Value);
    if (!isNone(NameNode))
      visitStoreContextNode(W, NameNode.get(), true);
    if (!isNone(Value))
      visitNode(W, Value.get());
  }
}

namespace {

void visitNameList(NW *W, PyObject *Node, PyObject *Prefix) {
  if (!isNodeOf(Node, C::CGlobalStmt) && !isNodeOf(Node, C::CNonlocalStmt))
    raiseCannotConvert(Node, nodeType(C::CGlobalStmt));
  Ref Names = nameListStmtGetUtf8NameList(node(Node));
  asList(Names.get());
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Names.get()); ++I) {
    Ref Name = Ref::borrow(PyList_GET_ITEM(Names.get(), I));
    appendLogicalTypeEquiv(W, Name.get(), Prefix);
  }
}

} // namespace

void visitGlobalStmt(NW *W, PyObject *Node) { visitNameList(W, Node, sym(Sym::kGlobalPrefix)); }
void visitNonlocalStmt(NW *W, PyObject *Node) { visitNameList(W, Node, sym(Sym::kNonlocalPrefix)); }

void visitReturn(NW *W, PyObject *Node) {
  Ref Value = returnStmtGetValue(asNodeOf(Node, C::CReturnStmt));
  if (isNone(Value))
    return;
  visitNode(W, Value.get());
  Ref Info = typeEquivForNode(W, Value.get(), nullptr);
  if (isNone(Info) || isTextOf(Info.get(), K.TupleInstance))
    return;
  recordTypeEquiv(W, K.Return, Info.get());
}

void visitYield(NW *W, PyObject *Node) {
  NodeObject *N = asNodeOf(Node, C::CYieldExpr);
  Ref Value = yieldExprGetValue(N);
  if (isNone(Value))
    return;
  visitNode(W, Value.get());
  Ref Info = typeEquivForNode(W, Value.get(), nullptr);
  if (isNone(Info))
    Info = Ref::borrow(K.Empty);
  if (yieldExprIsYieldFrom(N))
    Info = concat({K.FromBlank, Info.get()});
  recordTypeEquiv(W, K.Yield, Info.get());
}

void visitSingleDecorator(NW *W, PyObject *Node) {
  NodeObject *N = asNodeOf(Node, C::CSingleDecorator);
  Ref Dotted = decoratorGetDottedName(N);
  visitNode(W, Dotted.get());
  if (rawCount(N) == 3 && !isNodeOf(Dotted.get(), C::CNameLiteral) && !isNodeOf(Dotted.get(), C::CDottedName)) {
    // '@' namedexpr_test NEWLINE (3.9): a dotted name is called with the
    // function; a call has recorded itself; other expressions only read.
    Ref Name = text(W, Dotted.get(), dottedOnly());
    if (!isNone(Name))
      processFunctionCall(W, Name.get(), tl::require(PyList_New(0)).get());
    return;
  }
  Ref Args = decoratorGetUsedArgList(N);
  Ref FuncName = text(W, Dotted.get());
  processFunctionCall(W, FuncName.get(), Args.get());
}

void visitClassdef(NW *W, PyObject *Node) {
  asNodeOf(Node, C::CClassdefStmt);
  visitTypeParamsOf(W, Node);
  Ref Bases = classdefGetBaseClassList(asNodeOf(Node, C::CClassdefStmt));
  asList(Bases.get());
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Bases.get()); ++I) {
    Ref Item = Ref::borrow(PyList_GET_ITEM(Bases.get(), I));
    ArgInfoObject *A = asArgInfo(Item.get());
    Ref Value = field(A->Value);
    if (A->Name || isNone(Value))
      continue;
    Ref Text = text(W, Value.get(), dottedOnly());
    if (!isNone(Text))
      recordMethod(W, K.AppendBaseClassName, Text.get());
  }
}

void visitExceptClause(NW *W, PyObject *Node) {
  NodeObject *N = asNodeOf(Node, C::CExceptClause);
  Ref Target = exceptClauseGetTarget(N);
  Ref Type = exceptClauseGetExceptionType(N);
  if (isNone(Type))
    return;
  visitNode(W, Type.get());
  if (isNone(Target))
    return;
  if (!isNodeOf(Target.get(), C::CNameLiteral)) {
    // Only Python 2 admits other targets (`except E, (a, b):`, `except E, self.x:`),
    // and there they are assignment targets.
    processTargets(W, Target.get(), Py_None);
    visitStoreContextNode(W, Target.get(), false);
    return;
  }
  processTargets(W, Target.get(), Py_None);
  forEachInstanceInfo(W, Type.get(), [&](PyObject *Info) { addNodeInfoStr(W, Target.get(), Info); });
}

void addNodeInfoStr(NW *W, PyObject *NameNode, PyObject *IStr) {
  if (IStr == Py_None || (PyString_Check(IStr) && PyString_GET_SIZE(IStr) == 0))
    return;
  Ref Name = text(W, NameNode);
  if (!isNone(Name))
    appendLogicalTypeEquiv(W, Name.get(), IStr);
}

// ---- Calls and type equivalences ----

void visitPower(NW *W, PyObject *Node) {
  NodeObject *N = asNodeOf(Node, C::CPower);
  visitAtomPlusTrailers(W, powerGetAtom(N).get(), powerGetTrailers(N).get());
  Ref Exponent = powerGetExponentNode(N);
  if (!isNone(Exponent))
    visitNode(W, Exponent.get());
}

void visitAtomExpr(NW *W, PyObject *Node) {
  NodeObject *N = asNodeOf(Node, C::CAtomExpr);
  visitAtomPlusTrailers(W, atomExprGetAtom(N).get(), atomExprGetTrailers(N).get());
}

void visitAtomPlusTrailers(NW *W, PyObject *Atom, PyObject *AllTrailers) {
  Ref Trailers = Ref::borrow(asList(AllTrailers));
  if (isNodeOf(Atom, C::CNameLiteral))
    visitNameLiteral(W, Atom, Atom, Trailers.get(), -1);
  else if (PyList_GET_SIZE(Trailers.get()) > 0)
    visitLoadContextNode(W, Atom); // `(a or b)[k] = v` reads a and b, as a name before trailers is read
  else
    visitNode(W, Atom);
  // While the atom is a plain name and every trailer so far a plain ".name"
  // (native classes, the walker's own converter), the dotted text is built
  // here as the converter would render it, one trailer at a time.
  PyTypeObject *NameType = &nodeType(C::CNameLiteral);
  bool Plain = Py_TYPE(Atom) == NameType && Py_TYPE(W->ToText) == &nodeToTextConverterType() &&
               node(Atom)->Text && PyString_Check(node(Atom)->Text);
  std::string Dotted = Plain ? std::string(PyString_AS_STRING(node(Atom)->Text), PyString_GET_SIZE(node(Atom)->Text))
                             : std::string();
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Trailers.get()); ++I) {
    Ref Trailer = Ref::borrow(PyList_GET_ITEM(Trailers.get(), I));
    NodeObject *T = asNodeOf(Trailer.get(), C::CTrailer);
    Ref Tok = trailerGetInitialToken(T);
    Ref Inner = ref(childAt(T, 1));
    if (I >= kMaxChainPrefixes) {
      // Past the cap only what the trailer holds is read: no prefix is rendered.
      if (textIs(Tok.get(), "(") && rawCount(T) == 3)
        processFunctionCall(W, Py_None, getUsedArgInfoList(Inner.get()).get());
      else if (textIs(Tok.get(), "[") || textIs(Tok.get(), "{"))
        visitLoadContextNode(W, Inner.get());
      else if (!(textIs(Tok.get(), ".") && isNodeOf(Inner.get(), C::CNameLiteral)))
        visitNode(W, Inner.get());
      continue;
    }
    bool PlainBefore = Plain;
    Plain = Plain && Py_TYPE(Trailer.get()) == &nodeType(C::CTrailer) && rawCount(T) == 2 &&
            textIs(Tok.get(), ".") && Py_TYPE(Inner.get()) == NameType && node(Inner.get())->Text &&
            PyString_Check(node(Inner.get())->Text);
    if (Plain) {
      Dotted += '.';
      Dotted.append(PyString_AS_STRING(node(Inner.get())->Text), PyString_GET_SIZE(node(Inner.get())->Text));
    }
    if (textIs(Tok.get(), "(") && rawCount(T) == 3) {
      if (PlainBefore) { // the callee is the dotted name built so far
        processFunctionCall(W, bytes(Dotted).get(), getUsedArgInfoList(Inner.get()).get());
        continue;
      }
      Ref Previous = tl::require(PyList_GetSlice(Trailers.get(), 0, I));
      visitCall(W, Atom, Previous.get(), Inner.get());
    } else if (textIs(Tok.get(), ".") && isNodeOf(Inner.get(), C::CNameLiteral)) {
      visitName(W, Inner.get(), Atom, Trailers.get(), I, Plain ? &Dotted : nullptr);
    } else if (textIs(Tok.get(), "[") || textIs(Tok.get(), "{")) {
      visitLoadContextNode(W, Inner.get());
    } else {
      visitNode(W, Inner.get());
    }
  }
}

void visitCall(NW *W, PyObject *Atom, PyObject *PrevTrailers, PyObject *Arglist) {
  Ref FuncName = textForAtomPlusTrailers(W->ToText, Atom, PrevTrailers, dottedOnly());
  processFunctionCall(W, FuncName.get(), getUsedArgInfoList(Arglist).get());
}

void processFunctionCall(NW *W, PyObject *FuncName, PyObject *ArgList) {
  Ref Args = Ref::borrow(asList(ArgList));
  Py_ssize_t Count = PyList_GET_SIZE(Args.get());
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Args.get()); ++I) {
    Ref Item = Ref::borrow(PyList_GET_ITEM(Args.get(), I));
    Ref Value = field(asArgInfo(Item.get())->Value);
    if (Count > 1 && isNodeOf(Value.get(), C::CSingleUsedArgumentNode) &&
        usedArgIsUnparenthesizedGenExpr(node(Value.get()))) {
      Ref Error = createSyntaxError(K.GenExprMessage, logical(W), contextIndex(node(Value.get())));
      PyErr_SetObject(reinterpret_cast<PyObject *>(Py_TYPE(Error.get())), Error.get());
      throw tl::PyErrSet();
    }
    // Arguments are read even inside an assignment target (`f(x).y = 1` reads x).
    // A bare `*` or `**` without a value (only in broken trees) reads nothing.
    if (!isNone(Value))
      visitLoadContextNode(W, Value.get());
  }
  if (FuncName != Py_None && isTextOf(FuncName, K.Isinstance))
    processIsInstanceCall(W, Args.get());
  if (FuncName == Py_None)
    return;
  // Only calls with plain positional arguments are recorded: look before rendering any.
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Args.get()); ++I) {
    ArgInfoObject *A = asArgInfo(PyList_GET_ITEM(Args.get(), I));
    if (A->Name || A->Prefix || !A->Value || A->Value == Py_None)
      return;
  }
  std::string Joined = "(";
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Args.get()); ++I) {
    ArgInfoObject *A = asArgInfo(PyList_GET_ITEM(Args.get(), I));
    if (A->Name || A->Prefix || !A->Value || A->Value == Py_None)
      return;
    Ref Value = field(A->Value);
    Ref Text = text(W, Value.get());
    if (isNone(Text))
      return;
    if (I)
      Joined += ',';
    Joined.append(PyString_AS_STRING(Text.get()), PyString_GET_SIZE(Text.get()));
  }
  Joined += ')';
  appendLogicalTypeEquiv(W, FuncName, concat({sym(Sym::kCalledPrefix), bytes(Joined).get()}).get());
}

void processIsInstanceCall(NW *W, PyObject *ArgList) {
  Ref Args = Ref::borrow(asList(ArgList));
  if (PyList_GET_SIZE(Args.get()) != 2)
    return;
  Ref First = Ref::borrow(PyList_GET_ITEM(Args.get(), 0)), Second = Ref::borrow(PyList_GET_ITEM(Args.get(), 1));
  ArgInfoObject *A = asArgInfo(First.get()), *B = asArgInfo(Second.get());
  if (A->Name || A->Prefix || B->Name || B->Prefix)
    return;
  Ref Object = field(A->Value), Classes = field(B->Value);
  if (isNone(Object) || isNone(Classes))
    return;
  Ref Name = text(W, Object.get(), dottedOnly());
  if (isNone(Name))
    return;
  forEachInstanceInfo(W, Classes.get(), [&](PyObject *Info) { recordTypeEquiv(W, Name.get(), Info); });
}

void appendSubscriptedEquivNode(NW *W, PyObject *NameNode, PyObject *EquivNode, Py_ssize_t Subscript) {
  Ref Name = text(W, NameNode);
  if (!isNone(Name))
    appendLogicalAttrib(W, Name.get());
  if (isNone(Name) || EquivNode == Py_None)
    return;
  Ref Equiv = typeEquivForNode(W, EquivNode, nullptr);
  if (isNone(Equiv))
    return;
  PyObject *Prefix = sym(Sym::kTypedLiteralPrefix);
  if (PyString_GET_SIZE(Equiv.get()) >= PyString_GET_SIZE(Prefix) &&
      std::memcmp(PyString_AS_STRING(Equiv.get()), PyString_AS_STRING(Prefix), PyString_GET_SIZE(Prefix)) == 0)
    return;
  Ref Suffix = Subscript == -1 ? Ref::borrow(sym(Sym::kIterationSubscript))
                               : bytes("[" + std::to_string(static_cast<long long>(Subscript)) + "]");
  appendLogicalTypeEquiv(W, Name.get(), concat({Equiv.get(), Suffix.get()}).get());
}

Ref typeEquivForNode(NW *W, PyObject *Node, PyObject *Extra) {
  NodeObject *N = asAnyNode(Node);
  if (isNodeOf(Node, C::CAtom)) {
    Ref Bracket = atomGetInitialBracket(N);
    if (textIs(Bracket.get(), "["))
      return Ref::borrow(K.ListInstance);
    if (textIs(Bracket.get(), "{")) {
      TextOptions O;
      O.LiteralOnly = true;
      Ref Text = text(W, Node, O);
      return buildLiteralInfo(isSetLiteral(Node) ? K.KindSet : K.KindDict, Text.get());
    }
    if (textIs(Bracket.get(), "(")) {
      if (isTupleExpression(Node))
        return Ref::borrow(K.TupleInstance);
      if (rawCount(N) != 3)
        return none();
      Nesting Level(" while finding a type equivalence");
      return typeEquivForNode(W, obj(childAt(N, 1)), Extra);
    }
    if (atomIsTwoPlusStringLiterals(N))
      return Ref::borrow(stringIsUnicode(childAt(N, 0)) ? K.UnicodeInstance : K.StringInstance);
    return text(W, Node);
  }
  if (isNodeOf(Node, C::CTestListStarExpr) && testListIsTuple(N))
    return Ref::borrow(K.TupleInstance);
  // `(y := v)` has the type of v.
  if (isNodeOf(Node, C::CNamedExpr) && rawCount(N) == 3) {
    Nesting Level(" while finding a type equivalence");
    return typeEquivForNode(W, obj(childAt(N, 2)), Extra);
  }
  if (isNodeOf(Node, C::CFactorExpr)) {
    Ref Op = factorGetUnaryOperator(N);
    if ((textIs(Op.get(), "+") || textIs(Op.get(), "-")) && rawCount(N) > 1) {
      NodeObject *Operand = childAt(N, 1);
      if (isNodeOf(obj(Operand), C::CNumberLiteral))
        return Ref::borrow(numberIsFloat(Operand) ? K.FloatPrefixOnly : K.IntPrefixOnly);
    }
  }
  PyObject *Text = N->Text;
  if (textIs(Text, "None"))
    return Ref::borrow(K.NoneLiteral);
  if (textIs(Text, "True"))
    return Ref::borrow(K.TrueLiteral);
  if (textIs(Text, "False"))
    return Ref::borrow(K.FalseLiteral);
  if (isNodeOf(Node, C::CNumberLiteral))
    return buildLiteralInfo(numberIsFloat(N) ? K.KindFloat : K.KindInt,
                            W->IncludeExprText && Text ? Text : Py_None);
  if (isNodeOf(Node, C::CStringLiteral)) {
    PyObject *Kind = stringIsUnicode(N) ? K.UnicodeInstance : K.StringInstance;
    if (!W->IncludeExprText)
      return Ref::borrow(Kind);
    Ref Encoded = host::callOne(Host.EncodeStringLiteral, Text ? Text : Py_None);
    tl::expectType(PyString_Check(Encoded.get()), "bytes", Encoded.get());
    return concat({Kind, K.Blank, Encoded.get()});
  }
  if (isNodeOf(Node, C::CPower)) {
    if (!isNone(powerGetExponentNode(N)))
      return none();
    return textForAtomPlusTrailers(W->ToText, powerGetAtom(N).get(), powerGetTrailers(N).get());
  }
  if (isNodeOf(Node, C::CAtomExpr))
    return textForAtomPlusTrailers(W->ToText, atomExprGetAtom(N).get(), atomExprGetTrailers(N).get());
  return text(W, Node, dottedOnly());
}

} // namespace walker
} // namespace treelens
