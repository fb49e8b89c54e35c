// Statement node accessors: def, class, global/nonlocal, for, with, except, expression statements,
// annotations, return, decorators, and the import statements with their name lists.
#include "pysource/treelens/nodes/stmt.h"

#include "pysource/treelens/nodes/args.h"
#include "pysource/treelens/nodes/expr.h"
#include "pysource/treelens/nodes/nodehelp.h"
#include "pysource/treelens/nodes/records.h"

#include <cstring>
#include <string>

namespace treelens {

using tl::Ref;
using namespace nodehelp;
using C = NodeClass;

namespace {

/// Interned names of the Python-visible operations native callers dispatch on.
struct StmtNames {
  PyObject *GetParameters, *GetReturnType, *GetSuite, *GetBaseClassList, *GetUtf8NameList, *GetTarget,
      *GetInExpression, *GetBody, *GetElseBody, *GetAnnotatedAssignNode, *GetInitialTestExpr,
      *GetPostEqualsTestExpr, *GetAugAssignOp, *GetTypeHintNode, *GetValue, *GetAsNameList,
      *GetImportIndex, *GetFromString, *GetImportStar;
  PyObject *Import; ///< the keyword text _GetImportIndex looks for
};

const StmtNames &names() {
  static const StmtNames Names = {
      tl::internName("GetParameters"),         tl::internName("GetReturnType"),
      tl::internName("GetSuite"),              tl::internName("GetBaseClassList"),
      tl::internName("GetUtf8NameList"),       tl::internName("GetTarget"),
      tl::internName("GetInExpression"),       tl::internName("GetBody"),
      tl::internName("GetElseBody"),           tl::internName("GetAnnotatedAssignNode"),
      tl::internName("GetInitialTestExpr"),    tl::internName("GetPostEqualsTestExpr"),
      tl::internName("GetAugAssignOp"),        tl::internName("GetTypeHintNode"),
      tl::internName("GetValue"),              tl::internName("GetAsNameList"),
      tl::internName("_GetImportIndex"),       tl::internName("GetFromString"),
      tl::internName("GetImportStar"),         tl::internName("import")};
  return Names;
}

const FuncdefOps TheFuncdefOps;
const ClassdefOps TheClassdefOps;
const NameListStmtOps TheNameListOps;
const ForStmtOps TheForOps;
const WithStmtOps TheWithStmtOps;
const WithItemOps TheWithItemOps;
const ExceptClauseOps TheExceptOps;
const ExprStmtOps TheExprStmtOps;
const AnnotatedAssignOps TheAnnAssignOps;
const ReturnStmtOps TheReturnOps;
const DecoratorOps TheDecoratorOps;

/// c[K] as a new reference.
Ref child(NodeObject *N, Py_ssize_t K) { return ref(childAt(N, K)); }

/// A leaf's own text as a new reference (Py_None for an interior node).
Ref textOf(NodeObject *N) { return Ref::borrow(N->Text ? N->Text : Py_None); }

Ref newList() { return tl::require(PyList_New(0)); }

void append(PyObject *List, PyObject *Item) { tl::requireStatus(PyList_Append(List, Item)); }

const char NotEnoughEquals[] = "Not enough ='s";

/// The augmented-assignment operators of the 2.7 grammar, in its order.
const char *const AugAssignOps[] = {"+=", "-=", "*=", "/=", "%=", "&=", "|=", "^=",
                                    "<<=", ">>=", "**=", "//="};

} // namespace

// ---- CFuncdefStmt ----

/// 1 when child 2 of a def or class is a type parameter list (3.12), else 0.
Py_ssize_t typeParamsShift(NodeObject *N) {
  return rawCount(N) > 2 && isNodeOf(obj(childAt(N, 2)), C::CTypeParams) ? 1 : 0;
}

// funcdef: 'def' NAME [type_params] parameters ['->' test] ':' suite
Ref FuncdefOps::getName(NodeObject *N) const { return textOf(childAt(N, 1)); }

Ref FuncdefOps::getParameters(NodeObject *N) const { return child(N, 2 + typeParamsShift(N)); }

Ref FuncdefOps::getReturnType(NodeObject *N) const {
  Py_ssize_t S = typeParamsShift(N);
  if (childTextIs(N, 3 + S, "->"))
    return child(N, 4 + S);
  return none();
}

Ref FuncdefOps::getSuite(NodeObject *N) const { return child(N, -1); }

// ---- CClassdefStmt ----

// classdef: 'class' NAME [type_params] ['(' [arglist] ')'] ':' suite
Ref ClassdefOps::getBaseClassList(NodeObject *N) const {
  Py_ssize_t S = typeParamsShift(N);
  if (nodeGetChildCount(N) < 4 + S || !leafIs(childAt(N, 2 + S), "(") || leafIs(childAt(N, 3 + S), ")"))
    return newList();
  Ref Args = child(N, 3 + S);
  return getUsedArgInfoList(Args.get());
}

// ---- CGlobalStmt, CNonlocalStmt ----

// global_stmt: 'global' NAME (',' NAME)*
Ref NameListStmtOps::getUtf8NameList(NodeObject *N) const {
  Ref Names = newList();
  for (Py_ssize_t K = 1; K < rawCount(N); ++K) {
    NodeObject *Child = childAt(N, K);
    if (isNodeOf(obj(Child), C::CNameLiteral))
      append(Names.get(), Child->Text ? Child->Text : Py_None);
  }
  return Names;
}

// ---- CForStmt ----

// for_stmt: 'for' exprlist 'in' testlist ':' suite ['else' ':' suite]
Ref ForStmtOps::getTarget(NodeObject *N) const { return child(N, 1); }

Ref ForStmtOps::getInExpression(NodeObject *N) const { return child(N, 3); }

Ref ForStmtOps::getBody(NodeObject *N) const { return child(N, 5); }

Ref ForStmtOps::getElseBody(NodeObject *N) const {
  if (nodeGetChildCount(N) == 9 && childTextIs(N, 6, "else"))
    return child(N, 8);
  return none();
}

// ---- CWithStmt, CWithItem ----

// with_stmt: 'with' with_item (',' with_item)* ':' suite
Ref WithStmtOps::getWithItems(NodeObject *N) const {
  Ref Items = newList();
  for (Py_ssize_t K = 0; K < rawCount(N); ++K) {
    NodeObject *Child = childAt(N, K);
    if (isNodeOf(obj(Child), C::CWithItem))
      append(Items.get(), obj(Child));
  }
  return Items;
}

// with_item: test 'as' expr
Ref WithItemOps::getExpression(NodeObject *N) const { return child(N, 0); }

Ref WithItemOps::getTarget(NodeObject *N) const { return child(N, 2); }

// ---- CExceptClause ----

// except_clause: 'except' ['*'] [test [('as' | ',') test]]
Ref ExceptClauseOps::getExceptionType(NodeObject *N) const {
  return nodeGetChild(N, rawCount(N) > 2 && leafIs(childAt(N, 1), "*") ? 2 : 1);
}

Ref ExceptClauseOps::getTarget(NodeObject *N) const {
  Py_ssize_t Count = nodeGetChildCount(N);
  if (Count < 3)
    return none();
  Ref Sep = nodeGetChildText(N, Count - 2);
  if (textIs(Sep.get(), ",") || textIs(Sep.get(), "as"))
    return nodeGetChild(N, Count - 1);
  return none();
}

// ---- CExprStmt ----

// expr_stmt: testlist_star_expr (annassign | augassign (yield_expr|testlist) |
//                                ('=' (yield_expr|testlist_star_expr))*)
Py_ssize_t ExprStmtOps::getEqualCount(NodeObject *N) const {
  return neverRaises<Py_ssize_t>("pysource.treelens.CExprStmt.GetEqualCount", 0, [&] {
    Py_ssize_t Equals = 0;
    for (Py_ssize_t K = 0; K < rawCount(N); ++K)
      if (leafIs(childAt(N, K), "="))
        ++Equals;
    return Equals;
  });
}

Ref ExprStmtOps::getAnnotatedAssignNode(NodeObject *N) const {
  NodeObject *Ann = childAt(N, 1);
  return isNodeOf(obj(Ann), C::CAnnotatedAssignNode) ? ref(Ann) : none();
}

Ref ExprStmtOps::getInitialTestExpr(NodeObject *N) const { return child(N, 0); }

Ref ExprStmtOps::getPostEqualsTestExpr(NodeObject *N, Py_ssize_t EqualNum) const {
  // Position 2 * EqualNum + 2, computed without overflow.
  if (EqualNum > (PY_SSIZE_T_MAX - 2) / 2)
    tl::raise(PyExc_ValueError, NotEnoughEquals);
  if (EqualNum < PY_SSIZE_T_MIN / 2)
    tl::raise(PyExc_IndexError, "list index out of range");
  Py_ssize_t Pos = 2 * EqualNum + 2;
  if (Pos >= nodeGetChildCount(N))
    tl::raise(PyExc_ValueError, NotEnoughEquals);
  return child(N, Pos);
}

// ---- CAnnotatedAssignNode ----

// annassign: ':' test ['=' test]
Ref AnnotatedAssignOps::getTypeHintNode(NodeObject *N) const { return child(N, 1); }

Ref AnnotatedAssignOps::getPostEqualsTestExpr(NodeObject *N) const {
  return nodeGetChildCount(N) < 4 ? none() : child(N, 3);
}

// ---- CReturnStmt ----

// return_stmt: 'return' [testlist]
Ref ReturnStmtOps::getValue(NodeObject *N) const { return nodeGetChildCount(N) < 2 ? none() : child(N, 1); }

// ---- CSingleDecorator ----

// decorator: '@' dotted_name [ '(' [arglist] ')' ] NEWLINE
Ref DecoratorOps::getDottedName(NodeObject *N) const { return child(N, 1); }

Ref DecoratorOps::getUsedArgList(NodeObject *N) const {
  if (nodeGetChildCount(N) > 4 && childTextIs(N, 2, "(") && childTextIs(N, 4, ")")) {
    Ref Args = child(N, 3);
    return getUsedArgInfoList(Args.get());
  }
  return newList();
}

// ---- Import-name helpers ----

Py_ssize_t getMatchingChildToken(NodeObject *N, PyObject *Text) {
  return neverRaises<Py_ssize_t>("pysource.treelens._GetMatchingChildToken", -1, [&]() -> Py_ssize_t {
    for (Py_ssize_t K = 0; K < rawCount(N); ++K) {
      PyObject *T = childAt(N, K)->Text;
      T = T ? T : Py_None;
      if (T == Text)
        return K;
      if (PyString_CheckExact(T) && PyString_CheckExact(Text)) {
        if (PyString_GET_SIZE(T) == PyString_GET_SIZE(Text) &&
            std::memcmp(PyString_AS_STRING(T), PyString_AS_STRING(Text), PyString_GET_SIZE(T)) == 0)
          return K;
      } else if (tl::requireStatus(PyObject_RichCompareBool(T, Text, Py_EQ))) {
        return K;
      }
    }
    return -1;
  });
}

namespace {

void appendImportText(PyObject *NodeList, Py_ssize_t Begin, Py_ssize_t End, std::string &Out);

/// Appends the leaf texts under Item; the recursion is guarded against cyclic trees.
void appendNodeImportText(PyObject *Item, std::string &Out) {
  if (!isNode(Item))
    raiseCannotConvert(Item, cnodeType());
  NodeObject *N = node(Item);
  if (N->Text) {
    tl::expectType(PyString_Check(N->Text), "bytes", N->Text);
    Out.append(PyString_AS_STRING(N->Text), PyString_GET_SIZE(N->Text));
    return;
  }
  tl::NestingGuard Nesting("in _TextForImportName");
  if (Py_EnterRecursiveCall(" in _TextForImportName"))
    throw tl::PyErrSet();
  try {
    appendImportText(N->Children ? N->Children : Py_None, 0, PY_SSIZE_T_MAX, Out);
  } catch (...) {
    Py_LeaveRecursiveCall();
    throw;
  }
  Py_LeaveRecursiveCall();
}

/// Appends the leaf texts under the items [Begin, End) of NodeList.
void appendImportText(PyObject *NodeList, Py_ssize_t Begin, Py_ssize_t End, std::string &Out) {
  if (!PyList_Check(NodeList))
    raiseArgType("node_list", "list", NodeList);
  for (Py_ssize_t K = Begin; K < End && K < PyList_GET_SIZE(NodeList); ++K)
    appendNodeImportText(PyList_GET_ITEM(NodeList, K), Out);
}

Ref bytesOf(const std::string &Text) {
  return tl::require(PyString_FromStringAndSize(Text.data(), static_cast<Py_ssize_t>(Text.size())));
}

/// The import text of the items [Begin, End) of NodeList; a single leaf gives its own text object.
Ref importTextOfRange(PyObject *NodeList, Py_ssize_t Begin, Py_ssize_t End) {
  if (PyList_Check(NodeList) && End - Begin == 1 && Begin < PyList_GET_SIZE(NodeList)) {
    PyObject *Only = PyList_GET_ITEM(NodeList, Begin);
    if (isNode(Only) && node(Only)->Text && PyString_CheckExact(node(Only)->Text))
      return Ref::borrow(node(Only)->Text);
  }
  std::string Out;
  appendImportText(NodeList, Begin, End, Out);
  return bytesOf(Out);
}

/// textForImportName([N]).
Ref importTextOf(NodeObject *N) {
  if (N->Text && PyString_CheckExact(N->Text))
    return Ref::borrow(N->Text);
  std::string Out;
  appendNodeImportText(obj(N), Out);
  return bytesOf(Out);
}

} // namespace

Ref textForImportName(PyObject *NodeList) {
  Py_ssize_t Size = PyList_Check(NodeList) ? PyList_GET_SIZE(NodeList) : 0;
  return importTextOfRange(NodeList, 0, Size);
}

// dotted_as_name: dotted_name ['as' NAME]; import_as_name: NAME ['as' NAME]
Ref processSingleModuleNameAs(NodeObject *N) {
  PyTypeObject &T = asNameType();
  Ref Result = tl::require(T.tp_alloc(&T, 0));
  auto *Rec = reinterpret_cast<AsNameObject *>(Result.get());
  Ref ModuleName, AsName;
  if (nodeGetChildCount(N) == 3 && textIs(nodeGetChildText(N, 1).get(), "as")) {
    Ref Name = child(N, 0);
    ModuleName = importTextOf(node(Name.get()));
    AsName = nodeGetChildText(N, 2);
  } else {
    ModuleName = importTextOf(N);
  }
  tl::expectType(PyString_Check(ModuleName.get()), "bytes", ModuleName.get());
  Rec->ModuleName = ModuleName.release();
  if (AsName && AsName.get() != Py_None) {
    tl::expectType(PyString_Check(AsName.get()), "bytes", AsName.get());
    Rec->AsName = AsName.release();
  }
  return Result;
}

// dotted_as_names: dotted_as_name (',' dotted_as_name)*
// import_as_names: import_as_name (',' import_as_name)* [',']
Ref processAsNamesList(NodeObject *N) {
  Ref Result = newList();
  if (nodeGetChildCount(N) < 2 || !leafIs(childAt(N, 1), ",")) {
    append(Result.get(), processSingleModuleNameAs(N).get());
    return Result;
  }
  // Overrides called per name may change the children list, so it is read
  // again at each step and each child is held while it is processed.
  for (Py_ssize_t K = 0; K < rawCount(N); ++K) {
    Ref Child = child(N, K);
    if (!leafIs(node(Child.get()), ","))
      append(Result.get(), processSingleModuleNameAs(node(Child.get())).get());
  }
  return Result;
}

// ---- Native callers ----

namespace {

inline PyObject *overridden(NodeObject *N, PyObject *Name) { return tl::pythonOverride(obj(N), Name); }

template <class F> Ref dispatchRef(NodeObject *N, PyObject *Name, F &&Native) {
  if (overridden(N, Name))
    return tl::callMethod(obj(N), Name);
  return Native();
}

} // namespace

#define TL_REF_CALLER(Fn, OpsT, Cls, Name, Slot)                                                   \
  Ref Fn(NodeObject *N) {                                                                          \
    const OpsT *O = opsAs<OpsT>(N, C::Cls);                                                        \
    return dispatchRef(N, names().Name, [&] { return O->Slot(N); });                              \
  }
#define TL_NATIVE_CALLER(Fn, OpsT, Cls, Slot)                                                      \
  Ref Fn(NodeObject *N) { return opsAs<OpsT>(N, C::Cls)->Slot(N); }

TL_NATIVE_CALLER(funcdefGetName, FuncdefOps, CFuncdefStmt, getName)
TL_REF_CALLER(funcdefGetParameters, FuncdefOps, CFuncdefStmt, GetParameters, getParameters)
TL_REF_CALLER(funcdefGetReturnType, FuncdefOps, CFuncdefStmt, GetReturnType, getReturnType)
TL_REF_CALLER(funcdefGetSuite, FuncdefOps, CFuncdefStmt, GetSuite, getSuite)
TL_REF_CALLER(classdefGetBaseClassList, ClassdefOps, CClassdefStmt, GetBaseClassList, getBaseClassList)
TL_REF_CALLER(forStmtGetTarget, ForStmtOps, CForStmt, GetTarget, getTarget)
TL_REF_CALLER(forStmtGetInExpression, ForStmtOps, CForStmt, GetInExpression, getInExpression)
TL_REF_CALLER(forStmtGetBody, ForStmtOps, CForStmt, GetBody, getBody)
TL_REF_CALLER(forStmtGetElseBody, ForStmtOps, CForStmt, GetElseBody, getElseBody)
TL_NATIVE_CALLER(withStmtGetWithItems, WithStmtOps, CWithStmt, getWithItems)
TL_NATIVE_CALLER(withItemGetExpression, WithItemOps, CWithItem, getExpression)
TL_NATIVE_CALLER(withItemGetTarget, WithItemOps, CWithItem, getTarget)
TL_NATIVE_CALLER(exceptClauseGetExceptionType, ExceptClauseOps, CExceptClause, getExceptionType)
TL_NATIVE_CALLER(exceptClauseGetTarget, ExceptClauseOps, CExceptClause, getTarget)
TL_REF_CALLER(exprStmtGetAnnotatedAssignNode, ExprStmtOps, CExprStmt, GetAnnotatedAssignNode,
              getAnnotatedAssignNode)
TL_REF_CALLER(exprStmtGetInitialTestExpr, ExprStmtOps, CExprStmt, GetInitialTestExpr, getInitialTestExpr)
TL_REF_CALLER(annAssignGetTypeHintNode, AnnotatedAssignOps, CAnnotatedAssignNode, GetTypeHintNode,
              getTypeHintNode)
TL_REF_CALLER(annAssignGetPostEqualsTestExpr, AnnotatedAssignOps, CAnnotatedAssignNode,
              GetPostEqualsTestExpr, getPostEqualsTestExpr)
TL_REF_CALLER(returnStmtGetValue, ReturnStmtOps, CReturnStmt, GetValue, getValue)
TL_NATIVE_CALLER(decoratorGetDottedName, DecoratorOps, CSingleDecorator, getDottedName)
TL_NATIVE_CALLER(decoratorGetUsedArgList, DecoratorOps, CSingleDecorator, getUsedArgList)

#undef TL_REF_CALLER
#undef TL_NATIVE_CALLER

Ref nameListStmtGetUtf8NameList(NodeObject *N) {
  PyObject *O = obj(N);
  if (!isNodeOf(O, C::CGlobalStmt) && !isNodeOf(O, C::CNonlocalStmt))
    raiseCannotConvert(O, nodeType(C::CGlobalStmt));
  const auto *Ops = static_cast<const NameListStmtOps *>(opsOf(N));
  return dispatchRef(N, names().GetUtf8NameList, [&] { return Ops->getUtf8NameList(N); });
}

Py_ssize_t exprStmtGetEqualCount(NodeObject *N) {
  const ExprStmtOps *O = nullptr;
  if (!neverRaises("pysource.treelens.CExprStmt.GetEqualCount", false, [&] {
        O = opsAs<ExprStmtOps>(N, C::CExprStmt);
        return true;
      }))
    return 0;
  return O->getEqualCount(N);
}

Ref exprStmtGetPostEqualsTestExpr(NodeObject *N, Py_ssize_t EqualNum) {
  const ExprStmtOps *O = opsAs<ExprStmtOps>(N, C::CExprStmt);
  if (overridden(N, names().GetPostEqualsTestExpr)) {
    Ref Arg = tl::require(PyInt_FromSsize_t(EqualNum));
    return tl::callMethod(obj(N), names().GetPostEqualsTestExpr, Arg.get());
  }
  return O->getPostEqualsTestExpr(N, EqualNum);
}

namespace {

// Python-level operations of CExprStmt and the import classes: one native
// body each, called by the Python method and, unless overridden, by native code.

Ref augAssignOp(NodeObject *N) {
  Ref Op = nodeGetChildText(N, 1);
  for (const char *Candidate : AugAssignOps)
    if (textIs(Op.get(), Candidate))
      return Op;
  return none();
}

Ref importNamesAsNameList(NodeObject *N) { return processAsNamesList(childAt(N, 1)); }

Py_ssize_t importIndex(NodeObject *N) { return getMatchingChildToken(N, names().Import); }

Ref fromString(NodeObject *N) {
  Py_ssize_t I = fromImportGetImportIndex(N);
  if (I < 2)
    return none();
  return importTextOfRange(N->Children ? N->Children : Py_None, 1, I);
}

bool importStar(NodeObject *N) { return leafIs(childAt(N, -1), "*"); }

Ref fromAsNameList(NodeObject *N) {
  Py_ssize_t I = fromImportGetImportIndex(N);
  Ref Names = child(N, plus(I, 1));
  if (leafIs(node(Names.get()), "("))
    Names = child(N, plus(I, 2));
  return processAsNamesList(node(Names.get()));
}

} // namespace

Ref exprStmtGetAugAssignOp(NodeObject *N) {
  opsAs<ExprStmtOps>(N, C::CExprStmt);
  return dispatchRef(N, names().GetAugAssignOp, [&] { return augAssignOp(N); });
}

Ref importNamesGetAsNameList(NodeObject *N) {
  opsAs<NodeOps>(N, C::CImportNamesStmt);
  return dispatchRef(N, names().GetAsNameList, [&] { return importNamesAsNameList(N); });
}

Py_ssize_t fromImportGetImportIndex(NodeObject *N) {
  opsAs<NodeOps>(N, C::CFromImportStmt);
  if (overridden(N, names().GetImportIndex))
    return sizeOf(tl::callMethod(obj(N), names().GetImportIndex));
  return importIndex(N);
}

Ref fromImportGetFromString(NodeObject *N) {
  opsAs<NodeOps>(N, C::CFromImportStmt);
  return dispatchRef(N, names().GetFromString, [&] { return fromString(N); });
}

bool fromImportGetImportStar(NodeObject *N) {
  opsAs<NodeOps>(N, C::CFromImportStmt);
  if (overridden(N, names().GetImportStar))
    return truth(tl::callMethod(obj(N), names().GetImportStar));
  return importStar(N);
}

Ref fromImportGetAsNameList(NodeObject *N) {
  opsAs<NodeOps>(N, C::CFromImportStmt);
  return dispatchRef(N, names().GetAsNameList, [&] { return fromAsNameList(N); });
}

// ---- Python surface ----

namespace {

/// A Python method running the defining class's own slot (not a subclass's).
#define TL_PY_REF(Fn, Ops, OpsT, Slot)                                                             \
  PyObject *Fn(PyObject *Self, PyObject *) {                                                       \
    return tl::guard<PyObject *>(nullptr, [&] { return Ops.OpsT::Slot(node(Self)).release(); });   \
  }

TL_PY_REF(funcdef_GetParameters, TheFuncdefOps, FuncdefOps, getParameters)
TL_PY_REF(funcdef_GetReturnType, TheFuncdefOps, FuncdefOps, getReturnType)
TL_PY_REF(funcdef_GetSuite, TheFuncdefOps, FuncdefOps, getSuite)
TL_PY_REF(classdef_GetBaseClassList, TheClassdefOps, ClassdefOps, getBaseClassList)
TL_PY_REF(namelist_GetUtf8NameList, TheNameListOps, NameListStmtOps, getUtf8NameList)
TL_PY_REF(for_GetTarget, TheForOps, ForStmtOps, getTarget)
TL_PY_REF(for_GetInExpression, TheForOps, ForStmtOps, getInExpression)
TL_PY_REF(for_GetBody, TheForOps, ForStmtOps, getBody)
TL_PY_REF(for_GetElseBody, TheForOps, ForStmtOps, getElseBody)
TL_PY_REF(exprstmt_GetAnnotatedAssignNode, TheExprStmtOps, ExprStmtOps, getAnnotatedAssignNode)
TL_PY_REF(exprstmt_GetInitialTestExpr, TheExprStmtOps, ExprStmtOps, getInitialTestExpr)
TL_PY_REF(annassign_GetTypeHintNode, TheAnnAssignOps, AnnotatedAssignOps, getTypeHintNode)
TL_PY_REF(annassign_GetPostEqualsTestExpr, TheAnnAssignOps, AnnotatedAssignOps, getPostEqualsTestExpr)
TL_PY_REF(return_GetValue, TheReturnOps, ReturnStmtOps, getValue)

#undef TL_PY_REF

PyObject *exprstmt_GetPostEqualsTestExpr(PyObject *Self, PyObject *Arg) {
  return tl::guard<PyObject *>(nullptr, [&] {
    return TheExprStmtOps.ExprStmtOps::getPostEqualsTestExpr(node(Self), indexArg(Arg)).release();
  });
}

PyObject *exprstmt_GetAugAssignOp(PyObject *Self, PyObject *) {
  return tl::guard<PyObject *>(nullptr, [&] { return augAssignOp(node(Self)).release(); });
}

PyObject *importnames_GetAsNameList(PyObject *Self, PyObject *) {
  return tl::guard<PyObject *>(nullptr, [&] { return importNamesAsNameList(node(Self)).release(); });
}

PyObject *fromimport_GetImportIndex(PyObject *Self, PyObject *) {
  return PyInt_FromSsize_t(importIndex(node(Self)));
}

PyObject *fromimport_GetFromString(PyObject *Self, PyObject *) {
  return tl::guard<PyObject *>(nullptr, [&] { return fromString(node(Self)).release(); });
}

PyObject *fromimport_GetImportStar(PyObject *Self, PyObject *) {
  return tl::guard<PyObject *>(nullptr, [&] { return pyBool(importStar(node(Self))); });
}

PyObject *fromimport_GetAsNameList(PyObject *Self, PyObject *) {
  return tl::guard<PyObject *>(nullptr, [&] { return fromAsNameList(node(Self)).release(); });
}

#define TL_NOARGS(Name, Fn, Doc) {Name, Fn, METH_NOARGS, Doc}
#define TL_END {nullptr, nullptr, 0, nullptr}

PyMethodDef FuncdefMethods[] = {
    TL_NOARGS("GetParameters", funcdef_GetParameters, "GetParameters() -> CParametersNode"),
    TL_NOARGS("GetReturnType", funcdef_GetReturnType,
              "GetReturnType() -> CExpression or None: the annotation after '->'"),
    TL_NOARGS("GetSuite", funcdef_GetSuite, "GetSuite() -> node: the body"),
    TL_END};

PyMethodDef ClassdefMethods[] = {
    TL_NOARGS("GetBaseClassList", classdef_GetBaseClassList,
              "GetBaseClassList() -> list of CArgInfo: the arguments in the brackets"),
    TL_END};

PyMethodDef NameListMethods[] = {
    TL_NOARGS("GetUtf8NameList", namelist_GetUtf8NameList,
              "GetUtf8NameList() -> list of bytes: the declared names"),
    TL_END};

PyMethodDef ForMethods[] = {
    TL_NOARGS("GetTarget", for_GetTarget, "GetTarget() -> node: the targets after 'for'"),
    TL_NOARGS("GetInExpression", for_GetInExpression, "GetInExpression() -> node: the iterable after 'in'"),
    TL_NOARGS("GetBody", for_GetBody, "GetBody() -> node: the loop body"),
    TL_NOARGS("GetElseBody", for_GetElseBody, "GetElseBody() -> node or None: the suite after 'else'"),
    TL_END};

PyMethodDef ExprStmtMethods[] = {
    TL_NOARGS("GetAnnotatedAssignNode", exprstmt_GetAnnotatedAssignNode,
              "GetAnnotatedAssignNode() -> CAnnotatedAssignNode or None"),
    TL_NOARGS("GetInitialTestExpr", exprstmt_GetInitialTestExpr,
              "GetInitialTestExpr() -> node: the expression left of any '=' or operator"),
    {"GetPostEqualsTestExpr", exprstmt_GetPostEqualsTestExpr, METH_O,
     "GetPostEqualsTestExpr(equal_num) -> node: the expression after the (equal_num + 1)-th '='"},
    TL_NOARGS("GetAugAssignOp", exprstmt_GetAugAssignOp,
              "GetAugAssignOp() -> bytes or None: the augmented-assignment operator"),
    TL_END};

PyMethodDef AnnAssignMethods[] = {
    TL_NOARGS("GetTypeHintNode", annassign_GetTypeHintNode, "GetTypeHintNode() -> node: the annotation"),
    TL_NOARGS("GetPostEqualsTestExpr", annassign_GetPostEqualsTestExpr,
              "GetPostEqualsTestExpr() -> node or None: the value after '='"),
    TL_END};

PyMethodDef ReturnMethods[] = {
    TL_NOARGS("GetValue", return_GetValue, "GetValue() -> node or None: the returned value"), TL_END};

PyMethodDef ImportNamesMethods[] = {
    TL_NOARGS("GetAsNameList", importnames_GetAsNameList,
              "GetAsNameList() -> list of CAsName: the imported names with their aliases"),
    TL_END};

PyMethodDef FromImportMethods[] = {
    TL_NOARGS("_GetImportIndex", fromimport_GetImportIndex,
              "_GetImportIndex() -> int: position of the 'import' keyword, -1 when absent"),
    TL_NOARGS("GetFromString", fromimport_GetFromString,
              "GetFromString() -> bytes or None: the module text between 'from' and 'import'"),
    TL_NOARGS("GetImportStar", fromimport_GetImportStar, "GetImportStar() -> bool: 'import *'"),
    TL_NOARGS("GetAsNameList", fromimport_GetAsNameList,
              "GetAsNameList() -> list of CAsName: the imported names with their aliases"),
    TL_END};

// ---- Module functions ----

NodeObject *nodeArg(PyObject *Arg, const char *Name) {
  if (!isNode(Arg))
    raiseArgType(Name, cnodeType().tp_name, Arg);
  return node(Arg);
}

PyObject *mod_GetMatchingChildToken(PyObject *, PyObject *Args, PyObject *Kwds) {
  return tl::guard<PyObject *>(nullptr, [&] {
    static const char *Keywords[] = {"node", "text", nullptr};
    PyObject *Node, *Text;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "OO:_GetMatchingChildToken", const_cast<char **>(Keywords),
                                     &Node, &Text))
      throw tl::PyErrSet();
    NodeObject *N = nodeArg(Node, "node");
    if (Text != Py_None && !PyString_Check(Text))
      raiseArgType("text", PyString_Type.tp_name, Text);
    return PyInt_FromSsize_t(getMatchingChildToken(N, Text));
  });
}

PyObject *mod_TextForImportName(PyObject *, PyObject *NodeList) {
  return tl::guard<PyObject *>(nullptr, [&] {
    if (!PyList_Check(NodeList))
      raiseArgType("node_list", "list", NodeList);
    return textForImportName(NodeList).release();
  });
}

PyObject *mod_ProcessSingleModuleNameAs(PyObject *, PyObject *Node) {
  return tl::guard<PyObject *>(nullptr,
                               [&] { return processSingleModuleNameAs(nodeArg(Node, "node")).release(); });
}

PyObject *mod_ProcessAsNamesList(PyObject *, PyObject *Node) {
  return tl::guard<PyObject *>(nullptr, [&] { return processAsNamesList(nodeArg(Node, "node")).release(); });
}

/// The native-only node operations, by class and name, for _CallNativeNodeOp.
struct NativeOp {
  NodeClass Class;
  const char *Name;
  Ref (*Call)(NodeObject *);
};

const NativeOp NativeOps[] = {
    {C::CFuncdefStmt, "GetName", funcdefGetName},
    {C::CWithStmt, "GetWithItems", withStmtGetWithItems},
    {C::CWithItem, "GetExpression", withItemGetExpression},
    {C::CWithItem, "GetTarget", withItemGetTarget},
    {C::CExceptClause, "GetExceptionType", exceptClauseGetExceptionType},
    {C::CExceptClause, "GetTarget", exceptClauseGetTarget},
    {C::CExprStmt, "GetEqualCount",
     [](NodeObject *N) { return tl::require(PyInt_FromSsize_t(exprStmtGetEqualCount(N))); }},
    {C::CSingleDecorator, "GetDottedName", decoratorGetDottedName},
    {C::CSingleDecorator, "GetUsedArgList", decoratorGetUsedArgList},
    {C::CLambdaExpr, "GetArgumentsNode", lambdaGetArgumentsNode},
    {C::CLambdaExpr, "GetBodyExpr", lambdaGetBodyExpr},
};

PyObject *mod_CallNativeNodeOp(PyObject *, PyObject *Args) {
  return tl::guard<PyObject *>(nullptr, [&] {
    PyObject *Node;
    const char *Name;
    if (!PyArg_ParseTuple(Args, "Os:_CallNativeNodeOp", &Node, &Name))
      throw tl::PyErrSet();
    NodeObject *N = nodeArg(Node, "node");
    for (const NativeOp &Op : NativeOps)
      if (std::strcmp(Op.Name, Name) == 0 && isNodeOf(Node, Op.Class))
        return Op.Call(N).release();
    tl::raiseFormat(PyExc_AttributeError, "%.200s has no native-only operation %.200s", Py_TYPE(Node)->tp_name,
                    Name);
  });
}

} // namespace

PyMethodDef StmtFunctions[] = {
    {"_GetMatchingChildToken", tl::kwFunction(mod_GetMatchingChildToken), METH_VARARGS | METH_KEYWORDS,
     "_GetMatchingChildToken(node, text) -> int: position of the first child whose fText is text, or -1"},
    {"_TextForImportName", mod_TextForImportName, METH_O,
     "_TextForImportName(node_list) -> bytes: the leaf texts under the nodes, joined without blanks"},
    {"_ProcessSingleModuleNameAs", mod_ProcessSingleModuleNameAs, METH_O,
     "_ProcessSingleModuleNameAs(node) -> CAsName: a (dotted) name with its optional alias"},
    {"_ProcessAsNamesList", mod_ProcessAsNamesList, METH_O,
     "_ProcessAsNamesList(node) -> list of CAsName: the names of an import name list"},
    {"_CallNativeNodeOp", mod_CallNativeNodeOp, METH_VARARGS,
     "_CallNativeNodeOp(node, name) -> the result of the node's native-only operation name (test hook)"},
    TL_END};

#undef TL_NOARGS
#undef TL_END

const NodeOps *stmtClassOps(NodeClass Cls) {
  switch (Cls) {
  case C::CFuncdefStmt: return &TheFuncdefOps;
  case C::CClassdefStmt: return &TheClassdefOps;
  case C::CGlobalStmt:
  case C::CNonlocalStmt: return &TheNameListOps;
  case C::CForStmt: return &TheForOps;
  case C::CWithStmt: return &TheWithStmtOps;
  case C::CWithItem: return &TheWithItemOps;
  case C::CExceptClause: return &TheExceptOps;
  case C::CExprStmt: return &TheExprStmtOps;
  case C::CAnnotatedAssignNode: return &TheAnnAssignOps;
  case C::CReturnStmt: return &TheReturnOps;
  case C::CSingleDecorator: return &TheDecoratorOps;
  default: return nullptr;
  }
}

PyMethodDef *stmtClassMethods(NodeClass Cls) {
  switch (Cls) {
  case C::CFuncdefStmt: return FuncdefMethods;
  case C::CClassdefStmt: return ClassdefMethods;
  case C::CGlobalStmt:
  case C::CNonlocalStmt: return NameListMethods;
  case C::CForStmt: return ForMethods;
  case C::CExprStmt: return ExprStmtMethods;
  case C::CAnnotatedAssignNode: return AnnAssignMethods;
  case C::CReturnStmt: return ReturnMethods;
  case C::CImportNamesStmt: return ImportNamesMethods;
  case C::CFromImportStmt: return FromImportMethods;
  default: return nullptr;
  }
}

} // namespace treelens
