// CNode, CExpression and the node class tree: layout, base operations and the Python surface.
#include "pysource/treelens/nodes/node.h"

#include "fieldpickle.h"
#include "pysource/treelens/host/host.h"
#include "pysource/treelens/nodes/classtable.h"

#include <structmember.h>

#include <cstring>

namespace treelens {

using tl::Ref;

NodeMethodNames NodeNames;

namespace {

NodeTypeObject NodeTypes[static_cast<int>(NodeClass::Count)];

const NodeOps BaseNodeOps;
const ExpressionOps BaseExpressionOps;

/// Raises the conversion error of a list item or field that is not a CNode.
[[noreturn]] void raiseNotNode(PyObject *O) {
  tl::raiseFormat(PyExc_TypeError, "Cannot convert %.200s to %.200s", Py_TYPE(O)->tp_name,
                  cnodeType().tp_name);
}

/// Borrowed child I of N with Python's negative indexing; Py_None when N has
/// no children or I is not below the count.
PyObject *childAt(NodeObject *N, Py_ssize_t I) {
  if (!N->Children)
    return Py_None;
  Py_ssize_t Count = PyList_GET_SIZE(N->Children);
  if (I >= Count)
    return Py_None;
  if (I < 0) {
    I += Count;
    if (I < 0)
      tl::raise(PyExc_IndexError, "list index out of range");
  }
  PyObject *C = PyList_GET_ITEM(N->Children, I);
  if (!isNode(C))
    raiseNotNode(C);
  return C;
}

bool textEquals(PyObject *A, PyObject *B) {
  if (A == B)
    return true;
  if (PyString_CheckExact(A) && PyString_CheckExact(B))
    return PyString_GET_SIZE(A) == PyString_GET_SIZE(B) &&
           std::memcmp(PyString_AS_STRING(A), PyString_AS_STRING(B), PyString_GET_SIZE(A)) == 0;
  int R = PyObject_RichCompareBool(A, B, Py_EQ);
  if (R < 0)
    throw tl::PyErrSet();
  return R != 0;
}

/// Reports the pending exception as unraisable from the named operation.
void writeUnraisable(const char *Where) {
  PyObject *Name = PyString_FromString(Where);
  PyErr_WriteUnraisable(Name ? Name : Py_None);
  Py_XDECREF(Name);
}

} // namespace

PyTypeObject &nodeType(NodeClass C) { return NodeTypes[static_cast<int>(C)].Type; }

NodeObject *asNode(PyObject *O) {
  if (!isNode(O))
    raiseNotNode(O);
  return reinterpret_cast<NodeObject *>(O);
}

// ---- Native implementations (slots 1 to 7) ----

Py_ssize_t NodeOps::getChildCount(NodeObject *N) const {
  return N->Children ? PyList_GET_SIZE(N->Children) : 0;
}

PyObject *NodeOps::getChildText(NodeObject *N, Py_ssize_t I) const {
  return tl::guard<PyObject *>(nullptr, [&] {
    PyObject *C = childAt(N, I);
    if (C == Py_None)
      return Py_None;
    PyObject *T = reinterpret_cast<NodeObject *>(C)->Text;
    return T ? T : Py_None;
  });
}

PyObject *NodeOps::getChild(NodeObject *N, Py_ssize_t I) const {
  return tl::guard<PyObject *>(nullptr, [&] { return childAt(N, I); });
}

PyObject *NodeOps::getStateName(NodeObject *N) const {
  if (!N->ClsInfo) {
    PyErr_SetString(PyExc_AttributeError, "'NoneType' object has no attribute 'fName'");
    return nullptr;
  }
  return N->ClsInfo->Name ? N->ClsInfo->Name : Py_None;
}

bool NodeOps::doesChildTextMatch(NodeObject *N, PyObject *Text) const {
  if (!N->Children)
    return false;
  int R = tl::guard<int>(-1, [&] {
    for (Py_ssize_t I = 0; I < PyList_GET_SIZE(N->Children); ++I) {
      PyObject *C = PyList_GET_ITEM(N->Children, I);
      if (!isNode(C))
        raiseNotNode(C);
      PyObject *T = reinterpret_cast<NodeObject *>(C)->Text;
      if (textEquals(T ? T : Py_None, Text))
        return 1;
    }
    return 0;
  });
  if (R < 0) {
    writeUnraisable("pysource.treelens.CNode._DoesChildTextMatch");
    return false;
  }
  return R != 0;
}

PyObject *ExpressionOps::getSubExpr(NodeObject *, Py_ssize_t) const { return Py_None; }

Py_ssize_t ExpressionOps::getSubExprCount(NodeObject *) const { return 0; }

// ---- Native callers honouring Python overrides ----

namespace {

const ExpressionOps *exprOps(NodeObject *N) {
  if (!isNodeOf(reinterpret_cast<PyObject *>(N), NodeClass::CExpression))
    tl::raiseFormat(PyExc_TypeError, "Cannot convert %.200s to %.200s", Py_TYPE(N)->tp_name,
                    nodeType(NodeClass::CExpression).tp_name);
  return static_cast<const ExpressionOps *>(opsOf(N));
}

Py_ssize_t sizeResult(Ref R) {
  Py_ssize_t V = PyInt_AsSsize_t(R.get());
  if (V == -1 && PyErr_Occurred())
    throw tl::PyErrSet();
  return V;
}

Ref indexArg(Py_ssize_t I) { return tl::require(PyInt_FromSsize_t(I)); }

Ref borrowedResult(PyObject *R) {
  if (!R)
    throw tl::PyErrSet();
  return Ref::borrow(R);
}

} // namespace

Py_ssize_t nodeGetChildCount(NodeObject *N) {
  PyObject *Self = reinterpret_cast<PyObject *>(N);
  if (!tl::pythonOverride(Self, NodeNames.GetChildCount))
    return opsOf(N)->getChildCount(N);
  Py_ssize_t R = tl::guard<Py_ssize_t>(-1, [&] {
    return sizeResult(tl::callMethod(Self, NodeNames.GetChildCount));
  });
  if (R == -1 && PyErr_Occurred()) {
    writeUnraisable("pysource.treelens.CNode.GetChildCount");
    return 0;
  }
  return R;
}

Ref nodeGetChildText(NodeObject *N, Py_ssize_t I) {
  PyObject *Self = reinterpret_cast<PyObject *>(N);
  if (tl::pythonOverride(Self, NodeNames.GetChildText))
    return tl::callMethod(Self, NodeNames.GetChildText, indexArg(I).get());
  return borrowedResult(opsOf(N)->getChildText(N, I));
}

Ref nodeGetChild(NodeObject *N, Py_ssize_t I) {
  PyObject *Self = reinterpret_cast<PyObject *>(N);
  if (tl::pythonOverride(Self, NodeNames.GetChild))
    return tl::callMethod(Self, NodeNames.GetChild, indexArg(I).get());
  return borrowedResult(opsOf(N)->getChild(N, I));
}

Ref nodeGetStateName(NodeObject *N) {
  PyObject *Self = reinterpret_cast<PyObject *>(N);
  if (tl::pythonOverride(Self, NodeNames.GetStateName))
    return tl::callMethod(Self, NodeNames.GetStateName);
  return borrowedResult(opsOf(N)->getStateName(N));
}

bool nodeDoesChildTextMatch(NodeObject *N, PyObject *Text) {
  PyObject *Self = reinterpret_cast<PyObject *>(N);
  if (!tl::pythonOverride(Self, NodeNames.DoesChildTextMatch))
    return opsOf(N)->doesChildTextMatch(N, Text);
  int R = tl::guard<int>(-1, [&] {
    Ref V = tl::callMethod(Self, NodeNames.DoesChildTextMatch, Text);
    return tl::requireStatus(PyObject_IsTrue(V.get()));
  });
  if (R < 0) {
    writeUnraisable("pysource.treelens.CNode._DoesChildTextMatch");
    return false;
  }
  return R != 0;
}

Ref exprGetSubExpr(NodeObject *N, Py_ssize_t I) {
  PyObject *Self = reinterpret_cast<PyObject *>(N);
  if (tl::pythonOverride(Self, NodeNames.GetSubExpr))
    return tl::callMethod(Self, NodeNames.GetSubExpr, indexArg(I).get());
  return borrowedResult(exprOps(N)->getSubExpr(N, I));
}

Py_ssize_t exprGetSubExprCount(NodeObject *N) {
  PyObject *Self = reinterpret_cast<PyObject *>(N);
  if (tl::pythonOverride(Self, NodeNames.GetSubExprCount))
    return sizeResult(tl::callMethod(Self, NodeNames.GetSubExprCount));
  Py_ssize_t R = exprOps(N)->getSubExprCount(N);
  if (R == -1 && PyErr_Occurred())
    throw tl::PyErrSet();
  return R;
}

// ---- Python surface ----

namespace {

NodeObject *self(PyObject *O) { return reinterpret_cast<NodeObject *>(O); }

Py_ssize_t indexFromPython(PyObject *Arg) {
  if (!PyInt_Check(Arg) && !PyLong_Check(Arg) && !PyIndex_Check(Arg))
    tl::raiseFormat(PyExc_TypeError, "an integer is required");
  Py_ssize_t I = PyNumber_AsSsize_t(Arg, PyExc_OverflowError);
  if (I == -1 && PyErr_Occurred())
    throw tl::PyErrSet();
  return I;
}

PyObject *newRef(PyObject *O) {
  if (O)
    Py_INCREF(O);
  return O;
}

PyObject *node_GetChildCount(PyObject *Self, PyObject *) {
  return PyInt_FromSsize_t(BaseNodeOps.NodeOps::getChildCount(self(Self)));
}

PyObject *node_GetChildText(PyObject *Self, PyObject *Arg) {
  return tl::guard<PyObject *>(nullptr, [&] {
    return newRef(BaseNodeOps.NodeOps::getChildText(self(Self), indexFromPython(Arg)));
  });
}

PyObject *node_GetChild(PyObject *Self, PyObject *Arg) {
  return tl::guard<PyObject *>(nullptr, [&] {
    return newRef(BaseNodeOps.NodeOps::getChild(self(Self), indexFromPython(Arg)));
  });
}

PyObject *node_GetStateName(PyObject *Self, PyObject *) {
  return newRef(BaseNodeOps.NodeOps::getStateName(self(Self)));
}

PyObject *node_DoesChildTextMatch(PyObject *Self, PyObject *Text) {
  if (Text != Py_None && !PyString_Check(Text)) {
    PyErr_Format(PyExc_TypeError, "Argument '%.200s' has incorrect type (expected %.200s, got %.200s)",
                 "text", PyString_Type.tp_name, Py_TYPE(Text)->tp_name);
    return nullptr;
  }
  return PyBool_FromLong(BaseNodeOps.NodeOps::doesChildTextMatch(self(Self), Text));
}

PyObject *expr_GetSubExpr(PyObject *Self, PyObject *Arg) {
  return tl::guard<PyObject *>(nullptr, [&] {
    return newRef(BaseExpressionOps.ExpressionOps::getSubExpr(self(Self), indexFromPython(Arg)));
  });
}

PyObject *expr_GetSubExprCount(PyObject *Self, PyObject *) {
  Py_ssize_t R = BaseExpressionOps.ExpressionOps::getSubExprCount(self(Self));
  if (R == -1 && PyErr_Occurred())
    return nullptr;
  return PyInt_FromSsize_t(R);
}

PyMethodDef NodeMethods[] = {
    {"GetChildCount", node_GetChildCount, METH_NOARGS,
     "GetChildCount() -> int: number of children, 0 for a leaf"},
    {"GetChildText", node_GetChildText, METH_O,
     "GetChildText(i) -> bytes or None: text of child i (None for an interior child or i past the end)"},
    {"GetChild", node_GetChild, METH_O, "GetChild(i) -> CNode or None: child i, None past the end"},
    {"GetStateName", node_GetStateName, METH_NOARGS, "GetStateName() -> bytes: grammar state name"},
    {"_DoesChildTextMatch", node_DoesChildTextMatch, METH_O,
     "_DoesChildTextMatch(text) -> bool: whether some child's fText equals text"},
    {nullptr, nullptr, 0, nullptr}};

PyMethodDef ExpressionMethods[] = {
    {"GetSubExpr", expr_GetSubExpr, METH_O,
     "GetSubExpr(i) -> CExpression or None: the i'th sub expression that can be syntactically unpacked"},
    {"GetSubExprCount", expr_GetSubExprCount, METH_NOARGS,
     "GetSubExprCount() -> int: number of sub expressions that can be syntactically unpacked"},
    {nullptr, nullptr, 0, nullptr}};

PyObject *node_getChildren(PyObject *Self, void *) {
  return newRef(self(Self)->Children ? self(Self)->Children : Py_None);
}
PyObject *node_getText(PyObject *Self, void *) {
  return newRef(self(Self)->Text ? self(Self)->Text : Py_None);
}
PyObject *node_getContext(PyObject *Self, void *) {
  return newRef(self(Self)->Context ? self(Self)->Context : Py_None);
}
PyObject *node_getClsInfo(PyObject *Self, void *) {
  PyObject *I = reinterpret_cast<PyObject *>(self(Self)->ClsInfo);
  return newRef(I ? I : Py_None);
}
PyObject *node_getNextFree(PyObject *Self, void *) {
  PyObject *I = reinterpret_cast<PyObject *>(self(Self)->NextFree);
  return newRef(I ? I : Py_None);
}

PyGetSetDef NodeGetSets[] = {
    {const_cast<char *>("fChildren"), node_getChildren, nullptr,
     const_cast<char *>("children in source order, None for a leaf"), nullptr},
    {const_cast<char *>("fText"), node_getText, nullptr,
     const_cast<char *>("token text of a leaf, None for an interior node"), nullptr},
    {const_cast<char *>("fContext"), node_getContext, nullptr,
     const_cast<char *>("parse context: the token index"), nullptr},
    {const_cast<char *>("fClsInfo"), node_getClsInfo, nullptr,
     const_cast<char *>("CNodeClassInfo of the node's grammar state"), nullptr},
    {const_cast<char *>("fNextFree"), node_getNextFree, nullptr,
     const_cast<char *>("next node on the free list while discarded"), nullptr},
    {nullptr, nullptr, nullptr, nullptr, nullptr}};

int node_init(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  static const char *Keywords[] = {"cls_info", nullptr};
  PyObject *Info;
  if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "O:CNode", const_cast<char **>(Keywords), &Info))
    return -1;
  NodeObject *N = self(Self);
  Py_CLEAR(N->Text);
  Py_CLEAR(N->Children);
  Py_CLEAR(N->Context);
  Py_CLEAR(N->NextFree);
  if (Info != Py_None && !PyObject_TypeCheck(Info, &classInfoType())) {
    PyErr_Format(PyExc_TypeError, "Cannot convert %.200s to %.200s", Py_TYPE(Info)->tp_name,
                 classInfoType().tp_name);
    return -1;
  }
  ClassInfoObject *Old = N->ClsInfo;
  N->ClsInfo = Info == Py_None ? nullptr : reinterpret_cast<ClassInfoObject *>(Info);
  Py_XINCREF(N->ClsInfo);
  Py_XDECREF(Old);
  return 0;
}

int node_traverse(PyObject *Self, visitproc visit, void *arg) {
  NodeObject *N = self(Self);
  Py_VISIT(N->Children);
  Py_VISIT(N->Text);
  Py_VISIT(N->Context);
  Py_VISIT(N->ClsInfo);
  Py_VISIT(N->NextFree);
  return 0;
}

int node_clear(PyObject *Self) {
  NodeObject *N = self(Self);
  Py_CLEAR(N->Children);
  Py_CLEAR(N->Text);
  Py_CLEAR(N->Context);
  Py_CLEAR(N->ClsInfo);
  Py_CLEAR(N->NextFree);
  return 0;
}


PyObject *node_repr(PyObject *Self) {
  return tl::guard<PyObject *>(nullptr, [&] {
    Ref Cls = tl::require(PyObject_Str(reinterpret_cast<PyObject *>(Py_TYPE(Self))));
    Ref Name = tl::require(PyObject_Str(nodeGetStateName(self(Self)).get()));
    return PyString_FromFormat("%s: %s", PyString_AS_STRING(Cls.get()), PyString_AS_STRING(Name.get()));
  });
}

} // namespace

// A free list is a chain through NextFree; the trashcan keeps releasing a
// long chain from recursing deeply.
void nodeDealloc(PyObject *Self) {
  PyObject_GC_UnTrack(Self);
  Py_TRASHCAN_SAFE_BEGIN(Self)
  node_clear(Self);
  Py_TYPE(Self)->tp_free(Self);
  Py_TRASHCAN_SAFE_END(Self)
}

NodeObject *allocNode(PyTypeObject *T, ClassInfoObject *Info) {
  NodeObject *N = reinterpret_cast<NodeObject *>(T->tp_alloc(T, 0));
  if (!N)
    throw tl::PyErrSet();
  Py_XINCREF(Info);
  N->ClsInfo = Info;
  return N;
}

int initNodeTypes(PyObject *Module) {
  return tl::guard<int>(-1, [&] {
    NodeNames = {tl::internName("GetChildCount"), tl::internName("GetChildText"),
                 tl::internName("GetChild"),      tl::internName("GetStateName"),
                 tl::internName("_DoesChildTextMatch"), tl::internName("GetSubExpr"),
                 tl::internName("GetSubExprCount")};
    for (const NodeClassRow &Row : nodeClassRows()) {
      NodeTypeObject &NT = NodeTypes[static_cast<int>(Row.Class)];
      bool Root = Row.Class == NodeClass::CNode;
      const NodeOps *Ops = Row.Ops;
      if (!Ops && Root)
        Ops = &BaseNodeOps;
      if (!Ops && Row.Class == NodeClass::CExpression)
        Ops = &BaseExpressionOps;
      if (!Ops)
        Ops = NodeTypes[static_cast<int>(Row.Base)].Ops;
      NT.Ops = Ops;
      PyMethodDef *Methods = Row.Methods;
      if (Root)
        Methods = NodeMethods;
      else if (Row.Class == NodeClass::CExpression)
        Methods = ExpressionMethods;
      tl::TypeDesc D;
      D.Name = Row.QualName;
      D.Doc = Row.Doc;
      D.Size = sizeof(NodeObject);
      D.Base = Root ? nullptr : &nodeType(Row.Base);
      D.Flags = Py_TPFLAGS_DEFAULT | (Row.Final ? 0 : Py_TPFLAGS_BASETYPE);
      D.Methods = Methods;
      if (Root) {
        D.GetSets = NodeGetSets;
        D.Dealloc = nodeDealloc;
        D.Traverse = node_traverse;
        D.Clear = node_clear;
        D.Init = node_init;
        D.New = PyType_GenericNew;
        D.Repr = node_repr;
      }
      tl::requireStatus(tl::readyType(NT.Type, D));
      if (Row.Rules || Root || Row.Class == NodeClass::CExpression) {
        Ref Rules = tl::require(PyList_New(0));
        for (const char *const *R = Row.Rules; R && *R; ++R)
          tl::requireStatus(PyList_Append(Rules.get(), tl::require(PyString_FromString(*R)).get()));
        tl::requireStatus(PyDict_SetItemString(NT.Type.tp_dict, "kSupportedRules", Rules.get()));
        PyType_Modified(&NT.Type);
      }
      tl::requireStatus(tl::addType(Module, Row.Name, NT.Type));
    }
    PyTypeObject &Info = classInfoType();
    tl::registerPickle(cnodeType(),
                       {{"fChildren", tl::FieldKind::Object, offsetof(NodeObject, Children), &PyList_Type},
                        {"fText", tl::FieldKind::Object, offsetof(NodeObject, Text), &PyString_Type},
                        {"fContext", tl::FieldKind::Object, offsetof(NodeObject, Context)},
                        {"fClsInfo", tl::FieldKind::Object, offsetof(NodeObject, ClsInfo), &Info},
                        {"fNextFree", tl::FieldKind::Object, offsetof(NodeObject, NextFree), &cnodeType()}},
                       host::Host.UnpickleFields);
    return 0;
  });
}

} // namespace treelens
