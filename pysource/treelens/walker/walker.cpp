// CNodeWalker and CDispatchWalker: the walk driver with its limits, the dispatch by node class,
// the busy mark and the reset on every exit path, and the Python surface of both classes.
#include "pysource/treelens/walker/walker.h"

#include "fieldpickle.h"
#include "override.h"
#include "pysource/treelens/host/host.h"
#include "pysource/treelens/nodes/nodehelp.h"
#include "pysource/treelens/nodes/totext.h"
#include "pysource/treelens/walker/methods.h"
#include "pysource/treelens/walker/walkerimpl.h"
#include "typedesc.h"

#include <structmember.h>

#include <cstdint>

namespace treelens {
namespace walker {

using tl::Ref;
using namespace nodehelp;
using C = NodeClass;

namespace {

PyTypeObject NodeWalkerType;
PyTypeObject DispatchWalkerType;

const char kBusy[] = "Only one logical may be walked at a time";
const char kTooManyVisits[] = "Maximum number of calls to _VisitNode exceeded";
const char kTooDeep[] = "Maximum recurse count in _VisitNode exceeded";

PyObject *WalkName, *VisitNodeName;

NW *self(PyObject *O) { return reinterpret_cast<NW *>(O); }
DispatchWalkerObject *dself(PyObject *O) { return reinterpret_cast<DispatchWalkerObject *>(O); }

// ---- Dispatch by node class ----

/// The handler rows of the symbol walker, in the order their classes are tested.
enum Row : unsigned char {
  RowWithItem,
  RowImportNames,
  RowFromImport,
  RowExprStmt,
  RowForStmt,
  RowFuncdef,
  RowReturn,
  RowClassdef,
  RowLambda,
  RowGlobal,
  RowNonlocal,
  RowPower,
  RowAtomExpr,
  RowNameLiteral,
  RowCompFor,
  RowDecorator,
  RowDottedName,
  RowExceptClause,
  RowYield,
  RowNamedExpr,
  RowUsedArgument,
  RowCaseBlock,
  RowPattern,
  RowTypeParams,
  RowTypeAlias,
  RowOther
};

const C RowClasses[RowOther] = {C::CWithItem,   C::CImportNamesStmt, C::CFromImportStmt, C::CExprStmt,
                                C::CForStmt,    C::CFuncdefStmt,     C::CReturnStmt,     C::CClassdefStmt,
                                C::CLambdaExpr, C::CGlobalStmt,      C::CNonlocalStmt,   C::CPower,
                                C::CAtomExpr,   C::CNameLiteral,     C::CCompForNode,    C::CSingleDecorator,
                                C::CDottedName, C::CExceptClause,    C::CYieldExpr,      C::CNamedExpr,
                                C::CSingleUsedArgumentNode, C::CCaseBlock, C::CPattern, C::CTypeParams,
                                C::CTypeAliasStmt};

/// The row of each native node class, so that a node of a native class costs
/// one table read; instances of Python subclasses take the class tests.
Row RowOfClass[static_cast<int>(C::Count)];

void initRows() {
  for (int I = 0; I < static_cast<int>(C::Count); ++I) {
    RowOfClass[I] = RowOther;
    for (int R = 0; R < RowOther; ++R)
      if (PyType_IsSubtype(&nodeType(static_cast<C>(I)), &nodeType(RowClasses[R]))) {
        RowOfClass[I] = static_cast<Row>(R);
        break;
      }
  }
}

Row rowOf(PyObject *O) {
  PyTypeObject *T = Py_TYPE(O);
  if (!(T->tp_flags & Py_TPFLAGS_HEAPTYPE)) {
    auto First = reinterpret_cast<std::uintptr_t>(&nodeType(C::CNode));
    auto Offset = reinterpret_cast<std::uintptr_t>(T) - First;
    if (reinterpret_cast<std::uintptr_t>(T) >= First && Offset % sizeof(NodeTypeObject) == 0 &&
        Offset / sizeof(NodeTypeObject) < static_cast<std::uintptr_t>(C::Count))
      return RowOfClass[Offset / sizeof(NodeTypeObject)];
    return RowOther;
  }
  for (int R = 0; R < RowOther; ++R)
    if (isNodeOf(O, RowClasses[R]))
      return static_cast<Row>(R);
  return RowOther;
}

void dispatch(NW *W, PyObject *Node) {
  switch (rowOf(Node)) {
  case RowWithItem: return visitWithItem(W, Node);
  case RowImportNames: return visitImportNames(W, Node);
  case RowFromImport: return visitFromImport(W, Node);
  case RowExprStmt: return visitExprStmt(W, Node);
  case RowForStmt: return visitForStmt(W, Node);
  case RowFuncdef: return visitFuncdef(W, Node);
  case RowReturn: return visitReturn(W, Node);
  case RowClassdef: return visitClassdef(W, Node);
  case RowLambda: return visitLambdaExpr(W, Node);
  case RowGlobal: return visitGlobalStmt(W, Node);
  case RowNonlocal: return visitNonlocalStmt(W, Node);
  case RowPower: return visitPower(W, Node);
  case RowAtomExpr: return visitAtomExpr(W, Node);
  case RowNameLiteral: return visitNameLiteral(W, Node, Py_None, Py_None, -1);
  case RowCompFor: return visitCompForNode(W, Node);
  case RowDecorator: return visitSingleDecorator(W, Node);
  case RowDottedName: return visitDottedName(W, Node);
  case RowExceptClause: return visitExceptClause(W, Node);
  case RowYield: return visitYield(W, Node);
  case RowNamedExpr: return visitNamedExpr(W, Node);
  case RowUsedArgument: return visitUsedArgument(W, Node);
  case RowCaseBlock: return visitCaseBlock(W, Node);
  case RowPattern: return visitPattern(W, Node);
  case RowTypeParams: return visitTypeParams(W, Node);
  case RowTypeAlias: return visitTypeAlias(W, Node);
  case RowOther: return visitChildren(W, Node);
  }
}

/// Calls Body with the pending exception set aside, then puts it back.
template <class F> void keepingError(F &&Body) {
  PyObject *Type, *Value, *Tb;
  PyErr_Fetch(&Type, &Value, &Tb);
  Body();
  PyErr_Restore(Type, Value, Tb);
}

/// Visits the children of N in order through Visit, reading the list length
/// again before each step and holding each child while it is visited.
template <class F> void eachChild(PyObject *Node, F &&Visit) {
  if (Node == Py_None)
    tl::raise(PyExc_AttributeError, "None has no attribute named: fChildren");
  if (!isNode(Node))
    raiseCannotConvert(Node, cnodeType());
  Ref Children = Ref::borrow(node(Node)->Children);
  if (!Children)
    return;
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Children.get()); ++I) {
    Ref Child = Ref::borrow(PyList_GET_ITEM(Children.get(), I));
    Visit(Child.get());
  }
}

/// One C recursion level, so that a walker with raised limits still cannot
/// overflow the stack on a deep or cyclic tree.
struct CLevel {
  CLevel() {
    if (Py_EnterRecursiveCall(const_cast<char *>(" in _VisitNode")))
      throw tl::PyErrSet();
  }
  ~CLevel() { Py_LeaveRecursiveCall(); }
  CLevel(const CLevel &) = delete;
};

} // namespace

// ---- CNodeWalker ----

void visitNode(NW *W, PyObject *Node) {
  if (++W->VisitCount > W->MaxVisits)
    tl::raise(PyExc_RuntimeError, kTooManyVisits);
  if (++W->RecurseCount > W->MaxRecurseCount)
    tl::raise(PyExc_RuntimeError, kTooDeep);
  struct Leave {
    NW *W;
    ~Leave() { --W->RecurseCount; }
  } Leaving{W};
  CLevel Level;
  Ref Keep = Ref::borrow(Node);
  dispatch(W, Node);
}

void visitChildren(NW *W, PyObject *Node) {
  eachChild(Node, [&](PyObject *Child) { visitNode(W, Child); });
}

void reportWalkRuntimeError() {
  PyObject *Type, *Value, *Tb;
  PyErr_Fetch(&Type, &Value, &Tb);
  PyErr_NormalizeException(&Type, &Value, &Tb);
  Ref Keep[] = {Ref::steal(Type), Ref::steal(Value), Ref::steal(Tb)};
  Ref Repr = Ref::steal(PyObject_Repr(Value ? Value : Py_None));
  Ref Line = Repr ? Ref::steal(PyString_FromFormat("RuntimeError raised in CNodeWalker.Walk: %s",
                                                   PyString_AsString(Repr.get())))
                  : Ref();
  PyObject *Out = PySys_GetObject(const_cast<char *>("stdout"));
  if (Line && Out && Out != Py_None) {
    Ref KeepOut = Ref::borrow(Out);
    if (PyFile_WriteObject(Line.get(), Out, Py_PRINT_RAW) == 0)
      PyFile_WriteString("\n", Out);
  }
  if (PyErr_Occurred())
    PyErr_WriteUnraisable(WalkName);
}

namespace {

/// Marks a record whose walk stopped at a limit (or another RuntimeError):
/// what it holds is what the walk recorded up to there.
void markTruncated(PyObject *Logical) {
  if (Logical && PyObject_TypeCheck(Logical, host::Host.LogicalLineType))
    reinterpret_cast<host::LogicalLineObject *>(Logical)->Flags |= fastaccess::kFlagTruncated;
}

/// Back to idle: no logical, counters 0, name dicts empty.
void resetNodeWalker(NW *W) {
  keepingError([&] {
    PyObject *Logical = W->Logical;
    W->Logical = nullptr;
    W->VisitCount = 0;
    W->RecurseCount = 0;
    if (W->LoadedNames && PyDict_Check(W->LoadedNames))
      PyDict_Clear(W->LoadedNames);
    if (W->StoredNames && PyDict_Check(W->StoredNames))
      PyDict_Clear(W->StoredNames);
    for (PyObject *Order : {W->LoadedOrder, W->StoredOrder})
      if (Order && PyList_Check(Order) && PyList_GET_SIZE(Order))
        PyList_SetSlice(Order, 0, PyList_GET_SIZE(Order), nullptr);
    if (PyErr_Occurred())
      PyErr_Clear();
    Py_XDECREF(Logical);
  });
}

void nodeWalkerWalk(NW *W, PyObject *Node, PyObject *Logical) {
  if (W->Logical)
    tl::raise(PyExc_ValueError, kBusy);
  if (Node == Py_None)
    return;
  Ref KeepWalker = Ref::borrow(reinterpret_cast<PyObject *>(W));
  Ref KeepNode = Ref::borrow(Node);
  Py_INCREF(Logical);
  W->Logical = Logical;
  W->LoadNameContext = true;
  W->StoreWithinSubExpr = false;
  bool Visited = false;
  bool Ok = tl::guard<bool>(false, [&] {
    visitNode(W, Node);
    Visited = true;
    processNamesFound(W, Node);
    return true;
  });
  if (!Ok && PyErr_ExceptionMatches(PyExc_RuntimeError)) {
    reportWalkRuntimeError();
    markTruncated(Logical);
    // The names met before the limit are recorded all the same.
    Ok = Visited || tl::guard<bool>(false, [&] {
      processNamesFound(W, Node);
      return true;
    });
  }
  resetNodeWalker(W);
  if (!Ok)
    throw tl::PyErrSet();
}

} // namespace

void walk(PyObject *Walker, PyObject *Node, PyObject *Logical) {
  if (!PyObject_TypeCheck(Walker, &NodeWalkerType))
    raiseCannotConvert(Walker, NodeWalkerType);
  nodeWalkerWalk(self(Walker), Node, Logical);
}

// ---- CDispatchWalker ----

namespace {

PyObject *nodeStack(DispatchWalkerObject *W) {
  if (!W->NodeStack || !PyList_Check(W->NodeStack))
    tl::raise(PyExc_TypeError, "CDispatchWalker._fNodeStack is not a list");
  return W->NodeStack;
}

void emptyNodeStack(DispatchWalkerObject *W) {
  if (W->NodeStack && PyList_Check(W->NodeStack) && PyList_GET_SIZE(W->NodeStack))
    PyList_SetSlice(W->NodeStack, 0, PyList_GET_SIZE(W->NodeStack), nullptr);
}

void resetDispatchWalker(DispatchWalkerObject *W) {
  keepingError([&] {
    PyObject *Logical = W->Logical;
    W->Logical = nullptr;
    W->VisitCount = 0;
    W->RecurseCount = 0;
    emptyNodeStack(W);
    if (PyErr_Occurred())
      PyErr_Clear();
    Py_XDECREF(Logical);
  });
}

/// Runs the dispatch entry of Node's exact class; true when its children are to be visited.
bool runHandler(DispatchWalkerObject *W, PyObject *Node) {
  if (!W->DispatchDict)
    tl::raise(PyExc_AttributeError, "'NoneType' object has no attribute 'get'");
  Ref Dict = Ref::borrow(W->DispatchDict);
  Ref Entry = Ref::borrow(PyDict_GetItem(Dict.get(), reinterpret_cast<PyObject *>(Py_TYPE(Node))));
  if (Entry.get() == Py_False)
    return false;
  if (!Entry || Entry.get() == Py_None)
    return true;
  Ref Result = tl::require(
      PyObject_CallFunctionObjArgs(Entry.get(), reinterpret_cast<PyObject *>(W), Node, nullptr));
  return tl::isTrue(Result.get());
}

void dispatchVisitNodeBase(DispatchWalkerObject *W, PyObject *Node) {
  if (!isNode(Node))
    raiseCannotConvert(Node, cnodeType());
  if (++W->VisitCount > W->MaxVisits)
    tl::raise(PyExc_RuntimeError, kTooManyVisits);
  Ref Stack = Ref::borrow(nodeStack(W));
  tl::requireStatus(PyList_Append(Stack.get(), Node));
  if (PyList_GET_SIZE(Stack.get()) > W->MaxRecurseCount) {
    // Taken off again, so that the visits being unwound still find themselves
    // innermost and the limit is reported rather than a stack out of step.
    tl::requireStatus(PyList_SetSlice(Stack.get(), PyList_GET_SIZE(Stack.get()) - 1, PyList_GET_SIZE(Stack.get()), nullptr));
    tl::raise(PyExc_RuntimeError, kTooDeep);
  }
  Ref KeepWalker = Ref::borrow(reinterpret_cast<PyObject *>(W));
  Ref KeepNode = Ref::borrow(Node);
  bool Ok = tl::guard<bool>(false, [&] {
    CLevel Level;
    if (runHandler(W, Node))
      eachChild(Node, [&](PyObject *Child) { dispatchVisitNode(reinterpret_cast<PyObject *>(W), Child); });
    return true;
  });
  // The node must still be the innermost entry; a handler that rearranged the
  // stack gets an AssertionError rather than a corrupted walk.
  PyObject *Now = W->NodeStack;
  Py_ssize_t Size = Now && PyList_Check(Now) ? PyList_GET_SIZE(Now) : 0;
  bool InStep = Size > 0 && PyList_GET_ITEM(Now, Size - 1) == Node;
  if (!InStep && Py_OptimizeFlag == 0) {
    PyErr_SetString(PyExc_AssertionError, "CDispatchWalker node stack out of step with the visit");
    throw tl::PyErrSet();
  }
  if (Size > 0)
    keepingError([&] {
      if (PyList_SetSlice(Now, Size - 1, Size, nullptr) < 0)
        PyErr_Clear();
    });
  if (!Ok)
    throw tl::PyErrSet();
}

} // namespace

void dispatchVisitNode(PyObject *W, PyObject *Node) {
  if (tl::pythonOverride(W, VisitNodeName)) {
    tl::callMethod(W, VisitNodeName, Node);
    return;
  }
  dispatchVisitNodeBase(dself(W), Node);
}

void dispatchWalkBase(DispatchWalkerObject *W, PyObject *Node, PyObject *Logical) {
  if (!isNode(Node))
    raiseCannotConvert(Node, cnodeType());
  if (W->Logical)
    tl::raise(PyExc_ValueError, kBusy);
  Ref KeepWalker = Ref::borrow(reinterpret_cast<PyObject *>(W));
  Ref KeepNode = Ref::borrow(Node);
  Py_INCREF(Logical);
  W->Logical = Logical;
  emptyNodeStack(W);
  bool Ok = tl::guard<bool>(false, [&] {
    dispatchVisitNode(reinterpret_cast<PyObject *>(W), Node);
    return true;
  });
  if (!Ok && PyErr_ExceptionMatches(PyExc_RuntimeError)) {
    reportWalkRuntimeError();
    markTruncated(Logical);
    Ok = true;
  }
  resetDispatchWalker(W);
  if (!Ok)
    throw tl::PyErrSet();
}

void dispatchWalk(PyObject *W, PyObject *Node, PyObject *Logical) {
  if (!PyObject_TypeCheck(W, &DispatchWalkerType))
    raiseCannotConvert(W, DispatchWalkerType);
  if (tl::pythonOverride(W, WalkName)) {
    tl::callMethod(W, WalkName, Node, Logical);
    return;
  }
  dispatchWalkBase(dself(W), Node, Logical);
}

void dispatchWalkerSetUp(DispatchWalkerObject *W, PyObject *DispatchDict) {
  if (DispatchDict != Py_None)
    tl::expectType(PyDict_Check(DispatchDict), "dict", DispatchDict);
  if (W->Logical)
    tl::raise(PyExc_RuntimeError, "CDispatchWalker cannot be re-initialised while it walks");
  Ref Stack = tl::require(PyList_New(0));
  Py_XSETREF(W->DispatchDict, DispatchDict == Py_None ? nullptr : (Py_INCREF(DispatchDict), DispatchDict));
  Py_XSETREF(W->NodeStack, Stack.release());
  W->VisitCount = 0;
  W->RecurseCount = 0;
  W->MaxVisits = 10000;
  W->MaxRecurseCount = 40;
}

int dispatchWalkerTraverse(PyObject *Self, visitproc visit, void *arg) {
  DispatchWalkerObject *W = dself(Self);
  Py_VISIT(W->Logical);
  Py_VISIT(W->DispatchDict);
  Py_VISIT(W->NodeStack);
  return 0;
}

int dispatchWalkerClear(PyObject *Self) {
  DispatchWalkerObject *W = dself(Self);
  Py_CLEAR(W->Logical);
  Py_CLEAR(W->DispatchDict);
  Py_CLEAR(W->NodeStack);
  return 0;
}

PyTypeObject &nodeWalkerType() { return NodeWalkerType; }
PyTypeObject &dispatchWalkerType() { return DispatchWalkerType; }

// ---- Python surface ----

namespace {

int nodeWalkerInit(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<int>(-1, [&] {
    if (PyTuple_GET_SIZE(Args) != 0 || (Kwds && PyDict_Size(Kwds) != 0))
      tl::raise(PyExc_TypeError, "CNodeWalker() takes no arguments");
    NW *W = self(Self);
    if (W->Logical)
      tl::raise(PyExc_RuntimeError, "CNodeWalker cannot be re-initialised while it walks");
    Ref Loaded = tl::require(PyDict_New());
    Ref Stored = tl::require(PyDict_New());
    W->IncludeExprText = true;
    Ref ToText = newNodeToTextConverter(W->IncludeExprText, W->IncludeExprText, W->IncludeExprText);
    W->LoadNameContext = true;
    W->StoreWithinSubExpr = false;
    Py_XSETREF(W->LoadedNames, Loaded.release());
    Py_XSETREF(W->StoredNames, Stored.release());
    W->VisitCount = 0;
    W->RecurseCount = 0;
    W->MaxVisits = 10000;
    W->MaxRecurseCount = 40;
    Py_XSETREF(W->ToText, ToText.release());
    return 0;
  });
}

int nodeWalkerTraverse(PyObject *Self, visitproc visit, void *arg) {
  NW *W = self(Self);
  Py_VISIT(W->Logical);
  Py_VISIT(W->LoadedNames);
  Py_VISIT(W->StoredNames);
  Py_VISIT(W->ToText);
  Py_VISIT(W->LoadedOrder);
  Py_VISIT(W->StoredOrder);
  return 0;
}

int nodeWalkerClear(PyObject *Self) {
  NW *W = self(Self);
  Py_CLEAR(W->Logical);
  Py_CLEAR(W->LoadedNames);
  Py_CLEAR(W->StoredNames);
  Py_CLEAR(W->ToText);
  Py_CLEAR(W->LoadedOrder);
  Py_CLEAR(W->StoredOrder);
  return 0;
}

int dispatchWalkerInit(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<int>(-1, [&] {
    static const char *Keywords[] = {"dispatch_dict", nullptr};
    PyObject *Dict;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "O:CDispatchWalker", const_cast<char **>(Keywords), &Dict))
      throw tl::PyErrSet();
    dispatchWalkerSetUp(dself(Self), Dict);
    return 0;
  });
}

using OpObject = NW;
Ref done() { return opDone(); }

bool flag(PyObject *O) { return O && tl::isTrue(O); }

PyMethodDef NodeWalkerMethods[] = {
    TL_OP("Walk", "OO", TL_KEYWORDS("node", "logical"),
          "Walk(node, logical): records what the tree of one logical line defines and uses",
          nodeWalkerWalk(W, X[0], X[1]);
          return done()),
    TL_OP("_ProcessNamesFound", "O", TL_KEYWORDS("node"), "_ProcessNamesFound(node): records the names collected",
          processNamesFound(W, X[0]);
          return done()),
    TL_NODE_OP("_VisitChildren", visitChildren, "_VisitChildren(node): visits each child in order"),
    TL_OP("_RaiseIfNotInstance", "OO", TL_KEYWORDS("node", "cls"),
          "_RaiseIfNotInstance(node, cls): ValueError unless node is an instance of cls",
          (void)W; if (!tl::requireStatus(PyObject_IsInstance(X[0], X[1]))) {
            Ref ClsRepr = tl::require(PyObject_Repr(X[1]));
            Ref NodeRepr = tl::require(PyObject_Repr(X[0]));
            tl::raiseFormat(PyExc_ValueError, "Node is not a %s: %s", PyString_AsString(ClsRepr.get()),
                            PyString_AsString(NodeRepr.get()));
          } return done()),
    TL_NODE_OP("_VisitNode", visitNode, "_VisitNode(node): visits one node through its handler"),
    TL_OP("_VisitStoreContextNode", "O|O", TL_KEYWORDS("node", "within_sub_expr"),
          "_VisitStoreContextNode(node, within_sub_expr=False): visits node in store context",
          visitStoreContextNode(W, X[0], flag(X[1]));
          return done()),
    TL_NODE_OP("_VisitLoadContextNode", visitLoadContextNode, "_VisitLoadContextNode(node): visits node in load context"),
    TL_NODE_OP("_VisitCompForNode", visitCompForNode, "_VisitCompForNode(node): a comprehension for clause"),
    TL_OP("_VisitNameLiteral", "OOOO", TL_KEYWORDS("node", "atom_node", "all_trailers", "trailer_i"),
          "_VisitNameLiteral(node, atom_node, all_trailers, trailer_i): records one name leaf",
          visitNameLiteral(W, X[0], X[1], X[2], indexArg(X[3]));
          return done()),
    TL_NODE_OP("_VisitDottedName", visitDottedName, "_VisitDottedName(node): reads each prefix of a dotted name"),
    TL_OP("_ProcessLoadName", "O", TL_KEYWORDS("name"), "_ProcessLoadName(name): records name as read",
          processLoadName(W, X[0]);
          return done()),
    TL_NODE_OP("_VisitImportNames", visitImportNames, "_VisitImportNames(node): an import statement"),
    TL_NODE_OP("_VisitFromImport", visitFromImport, "_VisitFromImport(node): a from-import statement"),
    TL_NODE_OP("_VisitExprStmt", visitExprStmt, "_VisitExprStmt(node): an expression statement"),
    TL_NODE_OP("_VisitFuncdef", visitFuncdef, "_VisitFuncdef(node): a def header"),
    TL_NODE_OP("_VisitLambdaExpr", visitLambdaExpr, "_VisitLambdaExpr(node): a lambda"),
    TL_OP("_ProcessLambdaDefiningArgList", "O", TL_KEYWORDS("arg_list"),
          "_ProcessLambdaDefiningArgList(arg_list): lambda parameters as sub-expression bindings",
          processLambdaDefiningArgList(W, X[0]);
          return done()),
    TL_NODE_OP("_VisitGlobalStmt", visitGlobalStmt, "_VisitGlobalStmt(node): a global statement"),
    TL_NODE_OP("_VisitNonlocalStmt", visitNonlocalStmt, "_VisitNonlocalStmt(node): a nonlocal statement"),
    TL_NODE_OP("_VisitParameters", visitParameters, "_VisitParameters(node): the parameters of a def"),
    TL_OP("_ProcessDefiningArgList", "O", TL_KEYWORDS("arg_list"),
          "_ProcessDefiningArgList(arg_list): argument names and their equivalences",
          processDefiningArgList(W, X[0]);
          return done()),
    TL_NODE_OP("_VisitAssignment", visitAssignment, "_VisitAssignment(node): plain and chained assignment"),
    TL_NODE_OP("_VisitForStmt", visitForStmt, "_VisitForStmt(node): a for statement"),
    TL_OP("_ProcessTargets", "OO", TL_KEYWORDS("lhs", "rhs"),
          "_ProcessTargets(lhs, rhs): records assignment targets, unpacking sequences",
          processTargets(W, X[0], X[1]);
          return done()),
    TL_NODE_OP("_VisitAugAssign", visitAugAssign, "_VisitAugAssign(node): augmented assignment"),
    TL_NODE_OP("_VisitAnnotatedAssign", visitAnnotatedAssign, "_VisitAnnotatedAssign(node): annotated assignment"),
    TL_OP("_VisitReturn", "O", TL_KEYWORDS("return_stmt"), "_VisitReturn(return_stmt): a return statement",
          visitReturn(W, X[0]);
          return done()),
    TL_OP("_VisitYield", "O", TL_KEYWORDS("yield_expr"), "_VisitYield(yield_expr): a yield expression",
          visitYield(W, X[0]);
          return done()),
    TL_NODE_OP("_VisitPower", visitPower, "_VisitPower(node): an atom with trailers and exponent"),
    TL_NODE_OP("_VisitAtomExpr", visitAtomExpr, "_VisitAtomExpr(node): an atom with trailers"),
    TL_OP("_VisitAtomPlusTrailers", "OO", TL_KEYWORDS("atom_node", "all_trailers"),
          "_VisitAtomPlusTrailers(atom_node, all_trailers): names, subscripts and calls of a primary",
          visitAtomPlusTrailers(W, X[0], X[1]);
          return done()),
    TL_OP("_VisitCall", "OOO", TL_KEYWORDS("atom", "prev_trailers", "arglist"),
          "_VisitCall(atom, prev_trailers, arglist): one call", visitCall(W, X[0], X[1], X[2]);
          return done()),
    TL_OP("_ProcessFunctionCall", "OO", TL_KEYWORDS("func_name", "arg_list"),
          "_ProcessFunctionCall(func_name, arg_list): reads the arguments and records the call",
          processFunctionCall(W, X[0], X[1]);
          return done()),
    TL_NODE_OP("_VisitSingleDecorator", visitSingleDecorator, "_VisitSingleDecorator(node): a decorator"),
    TL_OP("_ProcessIsInstanceCall", "O", TL_KEYWORDS("arg_list"), "Record equivs for an isinstance call",
          processIsInstanceCall(W, X[0]);
          return done()),
    TL_OP("_VisitClassdef", "O", TL_KEYWORDS("classdef_node"), "_VisitClassdef(classdef_node): base classes",
          visitClassdef(W, X[0]);
          return done()),
    TL_OP("_VisitExceptClause", "O", TL_KEYWORDS("exc_clause"), "_VisitExceptClause(exc_clause): an except clause",
          visitExceptClause(W, X[0]);
          return done()),
    TL_OP("_AppendEquivNode", "OO", TL_KEYWORDS("name_node", "equiv_node"),
          "_AppendEquivNode(name_node, equiv_node): records one assignment target",
          appendEquivNode(W, X[0], X[1]);
          return done()),
    TL_OP("_AppendSubscriptedEquivNode", "OOO", TL_KEYWORDS("name_node", "equiv_node", "subscript"),
          "_AppendSubscriptedEquivNode(name_node, equiv_node, subscript): a target taking an element type",
          appendSubscriptedEquivNode(W, X[0], X[1], indexArg(X[2]));
          return done()),
    TL_OP("_AddNodeInfoStr", "OO", TL_KEYWORDS("name_node", "istr"),
          "_AddNodeInfoStr(name_node, istr): records one info for the node's text",
          addNodeInfoStr(W, X[0], X[1]);
          return done()),
    TL_OP("_TypeEquivForNode", "O|O", TL_KEYWORDS("node", "extra"),
          "_TypeEquivForNode(node) -> info bytes or None", return typeEquivForNode(W, X[0], X[1])),
    {nullptr, nullptr, 0, nullptr}};

PyObject *dispatch_Walk(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<PyObject *>(nullptr, [&] {
    static const char *Keywords[] = {"node", "logical", nullptr};
    PyObject *Node, *Logical;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "OO:Walk", const_cast<char **>(Keywords), &Node, &Logical))
      throw tl::PyErrSet();
    dispatchWalkBase(dself(Self), Node, Logical);
    Py_RETURN_NONE;
  });
}

PyObject *dispatch_VisitNode(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<PyObject *>(nullptr, [&] {
    static const char *Keywords[] = {"node", nullptr};
    PyObject *Node;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "O:_VisitNode", const_cast<char **>(Keywords), &Node))
      throw tl::PyErrSet();
    dispatchVisitNodeBase(dself(Self), Node);
    Py_RETURN_NONE;
  });
}

PyMethodDef DispatchWalkerMethods[] = {
    {"Walk", tl::kwFunction(dispatch_Walk), METH_VARARGS | METH_KEYWORDS,
     "Walk(node, logical): visits the tree, calling the dispatch entry of each node's exact class"},
    {"_VisitNode", tl::kwFunction(dispatch_VisitNode), METH_VARARGS | METH_KEYWORDS,
     "_VisitNode(node): runs the node's handler and, unless it says no, visits the children"},
    {nullptr, nullptr, 0, nullptr}};

#define TL_MEMBER(Name, Type, Struct, Field, Doc)                                                          \
  {const_cast<char *>(Name), Type, offsetof(Struct, Field), READONLY, const_cast<char *>(Doc)}

static_assert(sizeof(bool) == sizeof(char), "bool members are read as T_BOOL");

PyMemberDef NodeWalkerMembers[] = {
    TL_MEMBER("_fLogical", T_OBJECT, NW, Logical, "the record being walked; None while idle"),
    TL_MEMBER("_fLoadNameContext", T_BOOL, NW, LoadNameContext, "names met are read"),
    TL_MEMBER("_fStoreWithinSubExpr", T_BOOL, NW, StoreWithinSubExpr, "bindings are local to an expression"),
    TL_MEMBER("_fLoadedNames", T_OBJECT, NW, LoadedNames, "names read in this walk"),
    TL_MEMBER("_fStoredNames", T_OBJECT, NW, StoredNames, "names bound in sub-expressions in this walk"),
    TL_MEMBER("_fVisitCount", T_INT, NW, VisitCount, "visits in this walk"),
    TL_MEMBER("_fRecurseCount", T_INT, NW, RecurseCount, "current nesting depth"),
    TL_MEMBER("_fMaxVisits", T_INT, NW, MaxVisits, "visit limit per walk"),
    TL_MEMBER("_fMaxRecurseCount", T_INT, NW, MaxRecurseCount, "nesting limit"),
    TL_MEMBER("_fToText", T_OBJECT, NW, ToText, "the converter that renders nodes for the handlers"),
    TL_MEMBER("_fIncludeExprText", T_BOOL, NW, IncludeExprText, "the converter's options"),
    {nullptr, 0, 0, 0, nullptr}};

PyMemberDef DispatchWalkerMembers[] = {
    TL_MEMBER("_fLogical", T_OBJECT, DispatchWalkerObject, Logical, "the record being walked; None while idle"),
    TL_MEMBER("_fDispatchDict", T_OBJECT, DispatchWalkerObject, DispatchDict, "node class -> handler or False"),
    TL_MEMBER("_fVisitCount", T_INT, DispatchWalkerObject, VisitCount, "visits in this walk"),
    TL_MEMBER("_fRecurseCount", T_INT, DispatchWalkerObject, RecurseCount, "reset by Walk"),
    TL_MEMBER("_fMaxVisits", T_INT, DispatchWalkerObject, MaxVisits, "visit limit per walk"),
    TL_MEMBER("_fMaxRecurseCount", T_INT, DispatchWalkerObject, MaxRecurseCount, "depth limit"),
    TL_MEMBER("_fNodeStack", T_OBJECT, DispatchWalkerObject, NodeStack, "nodes whose visit is in progress"),
    {nullptr, 0, 0, 0, nullptr}};

} // namespace

std::vector<tl::FieldSpec> dispatchWalkerFields() {
  using F = tl::FieldKind;
  using DW = DispatchWalkerObject;
  return {{"_fLogical", F::Object, offsetof(DW, Logical)},
          {"_fDispatchDict", F::Object, offsetof(DW, DispatchDict), &PyDict_Type},
          {"_fVisitCount", F::Int, offsetof(DW, VisitCount)},
          {"_fRecurseCount", F::Int, offsetof(DW, RecurseCount)},
          {"_fMaxVisits", F::Int, offsetof(DW, MaxVisits)},
          {"_fMaxRecurseCount", F::Int, offsetof(DW, MaxRecurseCount)},
          {"_fNodeStack", F::Object, offsetof(DW, NodeStack), &PyList_Type}};
}

int initWalkerTypes(PyObject *Module) {
  return tl::guard<int>(-1, [&] {
    WalkName = tl::internName("Walk");
    VisitNodeName = tl::internName("_VisitNode");
    initWalkerConstants();
    initRows();
    using F = tl::FieldKind;

    tl::TypeDesc D;
    D.Name = "pysource.treelens.CNodeWalker";
    D.Doc = "CNodeWalker()\n\n"
            "Symbol walker: visits the tree of one logical line and records the names it defines and uses.";
    D.Size = sizeof(NW);
    D.Flags = Py_TPFLAGS_DEFAULT | Py_TPFLAGS_HAVE_GC;
    D.Methods = NodeWalkerMethods;
    D.Members = NodeWalkerMembers;
    D.Dealloc = tl::gcDealloc<nodeWalkerClear>;
    D.Traverse = nodeWalkerTraverse;
    D.Clear = nodeWalkerClear;
    D.Init = nodeWalkerInit;
    D.New = PyType_GenericNew;
    tl::requireStatus(tl::readyType(NodeWalkerType, D));
    tl::requireStatus(tl::addType(Module, "CNodeWalker", NodeWalkerType));
    tl::registerPickle(NodeWalkerType,
                       {{"_fLogical", F::Object, offsetof(NW, Logical)},
                        {"_fLoadNameContext", F::Bool, offsetof(NW, LoadNameContext)},
                        {"_fStoreWithinSubExpr", F::Bool, offsetof(NW, StoreWithinSubExpr)},
                        {"_fLoadedNames", F::Object, offsetof(NW, LoadedNames), &PyDict_Type},
                        {"_fStoredNames", F::Object, offsetof(NW, StoredNames), &PyDict_Type},
                        {"_fVisitCount", F::Int, offsetof(NW, VisitCount)},
                        {"_fRecurseCount", F::Int, offsetof(NW, RecurseCount)},
                        {"_fMaxVisits", F::Int, offsetof(NW, MaxVisits)},
                        {"_fMaxRecurseCount", F::Int, offsetof(NW, MaxRecurseCount)},
                        {"_fToText", F::Object, offsetof(NW, ToText), &nodeToTextConverterType()},
                        {"_fIncludeExprText", F::Bool, offsetof(NW, IncludeExprText)}},
                       host::Host.UnpickleFields);

    tl::TypeDesc DD;
    DD.Name = "pysource.treelens.CDispatchWalker";
    DD.Doc = "CDispatchWalker(dispatch_dict)\n\n"
             "Walker that calls the handler its dispatch dict gives for each node's exact class.";
    DD.Size = sizeof(DispatchWalkerObject);
    DD.Flags = Py_TPFLAGS_DEFAULT | Py_TPFLAGS_BASETYPE | Py_TPFLAGS_HAVE_GC;
    DD.Methods = DispatchWalkerMethods;
    DD.Members = DispatchWalkerMembers;
    DD.Dealloc = tl::gcDealloc<dispatchWalkerClear>;
    DD.Traverse = dispatchWalkerTraverse;
    DD.Clear = dispatchWalkerClear;
    DD.Init = dispatchWalkerInit;
    DD.New = PyType_GenericNew;
    tl::requireStatus(tl::readyType(DispatchWalkerType, DD));
    tl::requireStatus(tl::addType(Module, "CDispatchWalker", DispatchWalkerType));
    tl::registerPickle(DispatchWalkerType, dispatchWalkerFields(), host::Host.UnpickleFields);
    return 0;
  });
}

} // namespace walker
} // namespace treelens
