// Argument lists: parameter and argument node accessors, and the CArgInfo lists of definitions and calls.
#include "pysource/treelens/nodes/args.h"

#include "pysource/treelens/nodes/nodehelp.h"

namespace treelens {

using tl::Ref;
using namespace nodehelp;
using C = NodeClass;

namespace {

struct ArgNames {
  PyObject *GetNestedListNode, *GetName, *GetTypeExpr, *GetPrefix, *GetValue, *IsUnparenthesizedGenExpr;
};

const ArgNames &names() {
  static const ArgNames Names = {
      tl::internName("GetNestedListNode"), tl::internName("GetName"),
      tl::internName("GetTypeExpr"),       tl::internName("GetPrefix"),
      tl::internName("GetValue"),          tl::internName("IsUnparenthesizedGenExpr")};
  return Names;
}

const ParameterDefOps TheParameterDefOps;
const UsedArgumentOps TheUsedArgumentOps;

inline bool overridden(NodeObject *N, PyObject *Name) { return tl::pythonOverride(obj(N), Name) != nullptr; }

} // namespace

// ---- CFunctionParameterDef ----

// fpdef: NAME | '(' fplist ')'      tfpdef: NAME [':' test]
Ref ParameterDefOps::getNestedListNode(NodeObject *N) const {
  if (nodeGetChildCount(N) == 3 && childTextIs(N, 0, "("))
    return ref(childAt(N, 1));
  return none();
}

Ref ParameterDefOps::getName(NodeObject *N) const {
  if (paramGetNestedListNode(N).get() != Py_None)
    return none();
  return nodeGetChild(N, 0);
}

Ref ParameterDefOps::getTypeExpr(NodeObject *N) const {
  if (nodeGetChildCount(N) == 3 && childTextIs(N, 1, ":"))
    return ref(childAt(N, 2));
  return none();
}

// ---- CSingleUsedArgumentNode ----

// argument: test [comp_for] | test '=' test | '*' test | '**' test
Ref UsedArgumentOps::getPrefix(NodeObject *N) const {
  Ref First = nodeGetChildText(N, 0);
  if (textIs(First.get(), "*") || textIs(First.get(), "**"))
    return First;
  return none();
}

Ref UsedArgumentOps::getName(NodeObject *N) const {
  if (childTextIs(N, 1, "="))
    return ref(childAt(N, 0));
  return none();
}

Ref UsedArgumentOps::getValue(NodeObject *N) const {
  if (childTextIs(N, 1, "="))
    return ref(childAt(N, 2));
  return ref(N);
}

bool UsedArgumentOps::isUnparenthesizedGenExpr(NodeObject *N) const {
  return neverRaises("pysource.treelens.CSingleUsedArgumentNode.IsUnparenthesizedGenExpr", false, [&] {
    return nodeGetChildCount(N) == 2 && isNodeOf(obj(childAt(N, 1)), C::CCompForNode);
  });
}

// ---- Native callers ----

namespace {

template <class OpsT, class F> Ref dispatchRef(NodeObject *N, NodeClass Cls, PyObject *Name, F &&Slot) {
  const OpsT *O = opsAs<OpsT>(N, Cls);
  if (overridden(N, Name))
    return tl::callMethod(obj(N), Name);
  return Slot(O);
}

} // namespace

Ref paramGetNestedListNode(NodeObject *N) {
  return dispatchRef<ParameterDefOps>(N, C::CFunctionParameterDef, names().GetNestedListNode,
                                      [&](const ParameterDefOps *O) { return O->getNestedListNode(N); });
}

Ref paramGetName(NodeObject *N) {
  return dispatchRef<ParameterDefOps>(N, C::CFunctionParameterDef, names().GetName,
                                      [&](const ParameterDefOps *O) { return O->getName(N); });
}

Ref paramGetTypeExpr(NodeObject *N) {
  return dispatchRef<ParameterDefOps>(N, C::CFunctionParameterDef, names().GetTypeExpr,
                                      [&](const ParameterDefOps *O) { return O->getTypeExpr(N); });
}

Ref usedArgGetPrefix(NodeObject *N) {
  return dispatchRef<UsedArgumentOps>(N, C::CSingleUsedArgumentNode, names().GetPrefix,
                                      [&](const UsedArgumentOps *O) { return O->getPrefix(N); });
}

Ref usedArgGetName(NodeObject *N) {
  return dispatchRef<UsedArgumentOps>(N, C::CSingleUsedArgumentNode, names().GetName,
                                      [&](const UsedArgumentOps *O) { return O->getName(N); });
}

Ref usedArgGetValue(NodeObject *N) {
  return dispatchRef<UsedArgumentOps>(N, C::CSingleUsedArgumentNode, names().GetValue,
                                      [&](const UsedArgumentOps *O) { return O->getValue(N); });
}

bool usedArgIsUnparenthesizedGenExpr(NodeObject *N) {
  return neverRaises("pysource.treelens.CSingleUsedArgumentNode.IsUnparenthesizedGenExpr", false, [&] {
    const UsedArgumentOps *O = opsAs<UsedArgumentOps>(N, C::CSingleUsedArgumentNode);
    if (overridden(N, names().IsUnparenthesizedGenExpr))
      return truth(tl::callMethod(obj(N), names().IsUnparenthesizedGenExpr));
    return O->isUnparenthesizedGenExpr(N);
  });
}

// ---- CArgInfo lists ----

namespace {

ArgInfoObject *argInfo(const Ref &R) { return reinterpret_cast<ArgInfoObject *>(R.get()); }

/// Stores V (borrowed; None clears) in a CNode field of a CArgInfo.
void setNodeField(PyObject *&Field, PyObject *V) {
  if (V != Py_None && !isNode(V))
    raiseCannotConvert(V, cnodeType());
  PyObject *New = V == Py_None ? nullptr : V;
  Py_XINCREF(New);
  Py_XSETREF(Field, New);
}

/// Stores V (borrowed; None clears) in the byte-string prefix field.
void setPrefix(ArgInfoObject *A, PyObject *V) {
  if (V != Py_None)
    tl::expectType(PyString_Check(V), "bytes", V);
  PyObject *New = V == Py_None ? nullptr : V;
  Py_XINCREF(New);
  Py_XSETREF(A->Prefix, New);
}

void append(const Ref &List, PyObject *Item) { tl::requireStatus(PyList_Append(List.get(), Item)); }

/// A one-item list holding Item (borrowed).
Ref oneItemList(PyObject *Item) {
  Ref L = tl::require(PyList_New(0));
  append(L, Item);
  return L;
}

/// Whether Python assertions are enabled (the interpreter was not run with -O).
bool assertionsEnabled() { return Py_OptimizeFlag == 0; }

[[noreturn]] void failParenAssertion(NodeObject *Child) {
  Ref Text = tl::require(PyObject_Str(Child->Text ? Child->Text : Py_None));
  Ref Type = tl::require(PyObject_Str(reinterpret_cast<PyObject *>(Py_TYPE(Child))));
  tl::raiseFormat(PyExc_AssertionError, "Text is not ( or ): text = %s, type(child) = %s",
                  PyString_AS_STRING(Text.get()), PyString_AS_STRING(Type.get()));
}

bool nameOrPrefixSet(ArgInfoObject *A) { return A->Name || A->Prefix; }

// typedargslist / varargslist / fplist: parameters with '=' defaults, '*' and
// '**' prefixes, tfpdef annotations and nested fpdef tuples, comma separated.
Ref definingListOfArglist(NodeObject *List) {
  Ref Result = tl::require(PyList_New(0));
  Ref Arg = newArgInfo();
  bool ExpectDefault = false, ExpectAnnotation = false;
  Ref Children = Ref::borrow(List->Children);
  if (!Children)
    return Result;
  for (Py_ssize_t K = 0; K < PyList_GET_SIZE(Children.get()); ++K) {
    Ref ChildRef = Ref::borrow(PyList_GET_ITEM(Children.get(), K));
    if (!isNode(ChildRef.get()))
      raiseCannotConvert(ChildRef.get(), cnodeType());
    NodeObject *Child = node(ChildRef.get());
    if (isNodeOf(ChildRef.get(), C::CFunctionParameterDef)) {
      if (paramGetNestedListNode(Child).get() == Py_None) {
        setNodeField(argInfo(Arg)->Name, paramGetName(Child).get());
        setNodeField(argInfo(Arg)->TypeExpr, paramGetTypeExpr(Child).get());
      } else {
        append(Result, getDefiningArgInfoList(obj(childAt(Child, 1))).get());
      }
    } else if (leafIs(Child, ",")) {
      if (nameOrPrefixSet(argInfo(Arg))) {
        append(Result, Arg.get());
        Arg = newArgInfo();
      }
      ExpectDefault = ExpectAnnotation = false;
    } else if (leafIs(Child, "*") || leafIs(Child, "**")) {
      setPrefix(argInfo(Arg), Child->Text);
    } else if (leafIs(Child, "/")) {
      // The marker after the positional-only parameters names none.
    } else if (leafIs(Child, "=")) {
      ExpectDefault = true;
    } else if (leafIs(Child, ":")) {
      ExpectAnnotation = true;
    } else if (ExpectDefault) {
      setNodeField(argInfo(Arg)->Value, obj(Child));
    } else if (ExpectAnnotation) {
      setNodeField(argInfo(Arg)->TypeExpr, obj(Child));
    } else if (isNodeOf(obj(Child), C::CNameLiteral)) {
      setNodeField(argInfo(Arg)->Name, obj(Child));
    } else if (!leafIs(Child, "(") && !leafIs(Child, ")") && assertionsEnabled()) {
      failParenAssertion(Child);
    }
  }
  if (nameOrPrefixSet(argInfo(Arg)))
    append(Result, Arg.get());
  return Result;
}

/// Fills A from a CSingleUsedArgumentNode.
void fillFromUsedArgument(ArgInfoObject *A, NodeObject *Arg) {
  setPrefix(A, usedArgGetPrefix(Arg).get());
  setNodeField(A->Name, usedArgGetName(Arg).get());
  setNodeField(A->Value, usedArgGetValue(Arg).get());
}

} // namespace

Ref newArgInfo() {
  PyTypeObject &T = argInfoType();
  return tl::require(T.tp_alloc(&T, 0));
}

Ref getDefiningArgInfoList(PyObject *Node) {
  tl::NestingGuard Nesting("while listing parameters");
  Ref Current = Ref::borrow(Node);
  // parameters: '(' [typedargslist] ')'
  if (isNodeOf(Current.get(), C::CParametersNode)) {
    if (nodeGetChildCount(node(Current.get())) == 2)
      return tl::require(PyList_New(0));
    Current = ref(childAt(node(Current.get()), 1));
  }
  if (isNodeOf(Current.get(), C::CDefiningArglistNode))
    return definingListOfArglist(node(Current.get()));
  if (isNodeOf(Current.get(), C::CFunctionParameterDef)) {
    NodeObject *Param = node(Current.get());
    Ref Nested = paramGetNestedListNode(Param);
    if (Nested.get() != Py_None)
      return oneItemList(getDefiningArgInfoList(Nested.get()).get());
    Ref Arg = newArgInfo();
    setNodeField(argInfo(Arg)->Name, paramGetName(Param).get());
    setNodeField(argInfo(Arg)->TypeExpr, paramGetTypeExpr(Param).get());
    return oneItemList(Arg.get());
  }
  if (!isNodeOf(Current.get(), C::CNameLiteral) && assertionsEnabled()) {
    Ref Exc = tl::require(PyObject_CallFunctionObjArgs(PyExc_AssertionError, Current.get(), nullptr));
    PyErr_SetObject(PyExc_AssertionError, Exc.get());
    throw tl::PyErrSet();
  }
  Ref Arg = newArgInfo();
  setNodeField(argInfo(Arg)->Name, Current.get());
  return oneItemList(Arg.get());
}

Ref getUsedArgInfoList(PyObject *Node) {
  // arglist: argument (',' argument)* [','], and 2.7 '*' test / '**' test
  // directly in the list; a testlist of class bases.
  if (isNodeOf(Node, C::CUsedArglistNode) || isNodeOf(Node, C::CTestListStarExpr)) {
    Ref Result = tl::require(PyList_New(0));
    Ref Arg = newArgInfo();
    Ref Children = Ref::borrow(node(Node)->Children);
    for (Py_ssize_t K = 0; Children && K < PyList_GET_SIZE(Children.get()); ++K) {
      Ref ChildRef = Ref::borrow(PyList_GET_ITEM(Children.get(), K));
      if (!isNode(ChildRef.get()))
        raiseCannotConvert(ChildRef.get(), cnodeType());
      NodeObject *Child = node(ChildRef.get());
      if (leafIs(Child, ",")) {
        append(Result, Arg.get());
        Arg = newArgInfo();
      } else if (leafIs(Child, "*") || leafIs(Child, "**")) {
        setPrefix(argInfo(Arg), Child->Text);
      } else if (isNodeOf(obj(Child), C::CSingleUsedArgumentNode)) {
        fillFromUsedArgument(argInfo(Arg), Child);
      } else {
        setNodeField(argInfo(Arg)->Value, obj(Child));
      }
    }
    if (argInfo(Arg)->Value)
      append(Result, Arg.get());
    return Result;
  }
  Ref Arg = newArgInfo();
  if (isNodeOf(Node, C::CSingleUsedArgumentNode))
    fillFromUsedArgument(argInfo(Arg), node(Node));
  else
    setNodeField(argInfo(Arg)->Value, Node);
  return oneItemList(Arg.get());
}

// ---- Python surface ----

namespace {

#define TL_PY_REF(Fn, Ops, OpsT, Slot)                                                                       \
  PyObject *Fn(PyObject *Self, PyObject *) {                                                                 \
    return tl::guard<PyObject *>(nullptr, [&] { return Ops.OpsT::Slot(node(Self)).release(); });             \
  }

TL_PY_REF(param_GetNestedListNode, TheParameterDefOps, ParameterDefOps, getNestedListNode)
TL_PY_REF(param_GetName, TheParameterDefOps, ParameterDefOps, getName)
TL_PY_REF(param_GetTypeExpr, TheParameterDefOps, ParameterDefOps, getTypeExpr)
TL_PY_REF(usedarg_GetPrefix, TheUsedArgumentOps, UsedArgumentOps, getPrefix)
TL_PY_REF(usedarg_GetName, TheUsedArgumentOps, UsedArgumentOps, getName)
TL_PY_REF(usedarg_GetValue, TheUsedArgumentOps, UsedArgumentOps, getValue)

#undef TL_PY_REF

PyObject *usedarg_IsUnparenthesizedGenExpr(PyObject *Self, PyObject *) {
  return pyBool(TheUsedArgumentOps.UsedArgumentOps::isUnparenthesizedGenExpr(node(Self)));
}

PyObject *parameters_GetArgName(PyObject *, PyObject *) { Py_RETURN_NONE; }

PyObject *args_GetDefiningArgInfoList(PyObject *, PyObject *Node) {
  return tl::guard<PyObject *>(nullptr, [&] { return getDefiningArgInfoList(Node).release(); });
}

PyObject *args_GetUsedArgInfoList(PyObject *, PyObject *Node) {
  return tl::guard<PyObject *>(nullptr, [&] { return getUsedArgInfoList(Node).release(); });
}

PyMethodDef ParameterDefMethods[] = {
    {"GetNestedListNode", param_GetNestedListNode, METH_NOARGS,
     "GetNestedListNode() -> node or None: the list inside a 2.7 tuple parameter '(' list ')'"},
    {"GetName", param_GetName, METH_NOARGS, "GetName() -> node or None: Get NAME if not a nested list"},
    {"GetTypeExpr", param_GetTypeExpr, METH_NOARGS, "GetTypeExpr() -> node or None: the annotation"},
    {nullptr, nullptr, 0, nullptr}};

PyMethodDef UsedArgumentMethods[] = {
    {"GetPrefix", usedarg_GetPrefix, METH_NOARGS, "GetPrefix() -> '*', '**' or None"},
    {"GetName", usedarg_GetName, METH_NOARGS, "GetName() -> node or None: the keyword of name=value"},
    {"GetValue", usedarg_GetValue, METH_NOARGS,
     "GetValue() -> node: the value of name=value, else the argument node itself"},
    {"IsUnparenthesizedGenExpr", usedarg_IsUnparenthesizedGenExpr, METH_NOARGS,
     "IsUnparenthesizedGenExpr() -> bool: a bare generator argument such as f(x for x in y)"},
    {nullptr, nullptr, 0, nullptr}};

PyMethodDef ParametersMethods[] = {{"GetArgName", parameters_GetArgName, METH_O, "GetArgName(i) -> None"},
                                   {nullptr, nullptr, 0, nullptr}};

} // namespace

PyMethodDef ArgListFunctions[] = {
    {"GetDefiningArgInfoList", args_GetDefiningArgInfoList, METH_O,
     "GetDefiningArgInfoList(node) -> list of CArgInfo (nested lists for 2.7 tuple parameters): the "
     "parameters a def or lambda defines"},
    {"GetUsedArgInfoList", args_GetUsedArgInfoList, METH_O,
     "GetUsedArgInfoList(node) -> list of CArgInfo: the arguments of a call, decorator or class statement"},
    {nullptr, nullptr, 0, nullptr}};

const NodeOps *argsClassOps(NodeClass Cls) {
  switch (Cls) {
  case C::CFunctionParameterDef: return &TheParameterDefOps;
  case C::CSingleUsedArgumentNode: return &TheUsedArgumentOps;
  default: return nullptr;
  }
}

PyMethodDef *argsClassMethods(NodeClass Cls) {
  switch (Cls) {
  case C::CFunctionParameterDef: return ParameterDefMethods;
  case C::CSingleUsedArgumentNode: return UsedArgumentMethods;
  case C::CParametersNode: return ParametersMethods;
  default: return nullptr;
  }
}

} // namespace treelens
