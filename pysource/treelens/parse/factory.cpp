// CNodeFactory: builds nodes for the parser's converter callback and recycles them through per-state free lists.
#include "pysource/treelens/parse/parse.h"

#include "fieldpickle.h"
#include "pysource/treelens/host/host.h"

namespace treelens {

using tl::Ref;

namespace {

PyTypeObject FactoryType;

FactoryObject *self(PyObject *O) { return reinterpret_cast<FactoryObject *>(O); }

/// Borrowed entry I of a mapping-like object (a dict or anything with
/// __getitem__), or nullptr when it has none.
Ref lookupEntry(PyObject *Mapping, int I) {
  Ref Key = tl::require(PyInt_FromLong(I));
  if (PyDict_Check(Mapping))
    return Ref::borrow(PyDict_GetItem(Mapping, Key.get()));
  PyObject *V = PyObject_GetItem(Mapping, Key.get());
  if (!V) {
    if (!PyErr_ExceptionMatches(PyExc_KeyError))
      throw tl::PyErrSet();
    PyErr_Clear();
  }
  return Ref::steal(V);
}

[[noreturn]] void raiseUnpackCount(Py_ssize_t Got, Py_ssize_t Expected) {
  if (Got < Expected)
    tl::raiseFormat(PyExc_ValueError, "need more than %zd value%.1s to unpack", Got, Got == 1 ? "" : "s");
  tl::raiseFormat(PyExc_ValueError, "too many values to unpack (expected %zd)", Expected);
}

/// Pushes N on its class info's free list. Only nodes of exactly the class
/// the state instantiates are recycled, up to kMaxFreePerState of them; any
/// other node is simply released.
void pushFree(NodeObject *N) {
  ClassInfoObject *Info = N->ClsInfo;
  if (!Info || reinterpret_cast<PyObject *>(Py_TYPE(N)) != Info->Cls || Info->FreeCount >= kMaxFreePerState)
    return;
  ++Info->FreeCount;
  N->OnFreeList = true;
  NodeObject *Stale = N->NextFree;
  N->NextFree = Info->FirstFree; // takes over the record's reference to the old head
  Py_INCREF(N);
  Info->FirstFree = N;
  Py_XDECREF(Stale);
}

void factory_clearFields(FactoryObject *F) {
  if (F->ClassInfoList && PyList_Check(F->ClassInfoList)) {
    for (Py_ssize_t I = 0; I < PyList_GET_SIZE(F->ClassInfoList); ++I) {
      PyObject *Info = PyList_GET_ITEM(F->ClassInfoList, I);
      if (PyObject_TypeCheck(Info, &classInfoType()))
        drainFreeList(reinterpret_cast<ClassInfoObject *>(Info));
    }
  }
  if (F->KeywordClassInfo)
    drainFreeList(F->KeywordClassInfo);
  Py_CLEAR(F->ClassInfoList);
  Py_CLEAR(F->KeywordClassInfo);
  Py_CLEAR(F->Keywords);
}

int factory_init(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<int>(-1, [&] {
    if (Kwds && PyDict_Size(Kwds) > 0)
      tl::raise(PyExc_TypeError, "__init__() takes no keyword arguments");
    Py_ssize_t N = PyTuple_GET_SIZE(Args);
    if (N != 4)
      tl::raiseFormat(PyExc_TypeError, "%.200s() takes %.8s %zd positional argument%.1s (%zd given)",
                      "__init__", "exactly", static_cast<Py_ssize_t>(4), "s", N);
    PyObject *Gram = PyTuple_GET_ITEM(Args, 0), *ClsForNodeType = PyTuple_GET_ITEM(Args, 1),
             *Keywords = PyTuple_GET_ITEM(Args, 2), *TokNumber2Name = PyTuple_GET_ITEM(Args, 3);
    FactoryObject *F = self(Self);
    factory_clearFields(F);
    F->ClassInfoList = tl::require(PyList_New(0)).release();
    F->Keywords = tl::require(PyDict_New()).release();

    Ref Number2Symbol = tl::require(PyObject_GetAttrString(Gram, "number2symbol"));
    Ref Iter = tl::require(PyObject_GetIter(ClsForNodeType));
    int NodeType = 0;
    while (PyObject *Item = PyIter_Next(Iter.get())) {
      Ref Cls = Ref::steal(Item);
      if (NodeType > kMaxStateNumber)
        tl::raise(PyExc_ValueError, "more node classes than grammar states");
      Ref Name = lookupEntry(Number2Symbol.get(), NodeType);
      if (!Name)
        Name = lookupEntry(TokNumber2Name, NodeType);
      Ref Info = newClassInfo(Cls.get(), NodeType, Name ? Name.get() : Py_None);
      tl::requireStatus(PyList_Append(F->ClassInfoList, Info.get()));
      ++NodeType;
    }
    if (PyErr_Occurred())
      throw tl::PyErrSet();

    int IsTrue = tl::requireStatus(PyObject_IsTrue(Keywords));
    if (IsTrue) {
      Ref KeywordName = tl::require(PyString_FromString("KEYWORD"));
      F->KeywordClassInfo = reinterpret_cast<ClassInfoObject *>(
          newClassInfo(reinterpret_cast<PyObject *>(&nodeType(NodeClass::CKeywordLiteral)), kName,
                       KeywordName.get())
              .release());
      tl::expectType(PyDict_Check(Keywords), "dict", Keywords);
      Py_INCREF(Keywords);
      Py_XSETREF(F->Keywords, Keywords);
    }
    return 0;
  });
}

int factory_traverse(PyObject *Self, visitproc visit, void *arg) {
  FactoryObject *F = self(Self);
  Py_VISIT(F->ClassInfoList);
  Py_VISIT(F->KeywordClassInfo);
  Py_VISIT(F->Keywords);
  return 0;
}

int factory_clear(PyObject *Self) {
  factory_clearFields(self(Self));
  return 0;
}

// The free lists die with the factory: the nodes and their class infos
// refer to each other, so the lists are emptied here.
void factory_dealloc(PyObject *Self) {
  PyObject_GC_UnTrack(Self);
  factory_clearFields(self(Self));
  Py_TYPE(Self)->tp_free(Self);
}

int intArg(PyObject *O) {
  long V = PyInt_AsLong(O);
  if (V == -1 && PyErr_Occurred())
    throw tl::PyErrSet();
  if (V < INT_MIN || V > INT_MAX)
    tl::raise(PyExc_OverflowError, "value too large to convert to int");
  return static_cast<int>(V);
}

PyObject *factory_ConvertSingleNode(PyObject *Self, PyObject *Args) {
  return tl::guard<PyObject *>(nullptr, [&] {
    PyObject *NodeType, *Value, *Context, *Children;
    if (!PyArg_ParseTuple(Args, "OOOO:ConvertSingleNode", &NodeType, &Value, &Context, &Children))
      throw tl::PyErrSet();
    return convertSingleNode(self(Self), intArg(NodeType), Value, Context, Children).release();
  });
}

PyObject *factory_NewNode(PyObject *, PyObject *Args) {
  return tl::guard<PyObject *>(nullptr, [&] {
    PyObject *Info, *NodeType, *Value, *Context, *Children;
    if (!PyArg_ParseTuple(Args, "OOOOO:NewNode", &Info, &NodeType, &Value, &Context, &Children))
      throw tl::PyErrSet();
    if (!PyObject_TypeCheck(Info, &classInfoType()))
      tl::raiseFormat(PyExc_TypeError, "Argument '%.200s' has incorrect type (expected %.200s, got %.200s)",
                      "cls_info", classInfoType().tp_name, Py_TYPE(Info)->tp_name);
    intArg(NodeType);
    return newNode(reinterpret_cast<ClassInfoObject *>(Info), Value, Context, Children).release();
  });
}

PyObject *factory_DiscardNodes(PyObject *, PyObject *Args, PyObject *Kwds) {
  return tl::guard<PyObject *>(nullptr, [&] {
    static const char *Keywords[] = {"node", "depth", nullptr};
    PyObject *Node;
    int Depth = 0;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "O|i:DiscardNodes", const_cast<char **>(Keywords), &Node,
                                     &Depth))
      throw tl::PyErrSet();
    discardNodes(Node, Depth);
    Py_RETURN_NONE;
  });
}

PyObject *factory_RecursiveConvert(PyObject *Self, PyObject *Raw) {
  return tl::guard<PyObject *>(nullptr, [&] { return recursiveConvert(self(Self), Raw).release(); });
}

PyObject *factory_FreeNodeCount(PyObject *Self, PyObject *) {
  return tl::guard<PyObject *>(nullptr, [&] { return PyInt_FromSsize_t(factoryFreeNodeCount(self(Self))); });
}

PyMethodDef FactoryMethods[] = {
    {"ConvertSingleNode", factory_ConvertSingleNode, METH_VARARGS,
     "ConvertSingleNode(node_type, value, context, children) -> CNode"},
    {"NewNode", factory_NewNode, METH_VARARGS,
     "NewNode(cls_info, node_type, value, context, children) -> CNode, reusing a discarded node when "
     "the state has one"},
    {"DiscardNodes", tl::kwFunction(factory_DiscardNodes), METH_VARARGS | METH_KEYWORDS,
     "DiscardNodes(node, depth=0): returns a tree to the free lists"},
    {"RecursiveConvert", factory_RecursiveConvert, METH_O,
     "RecursiveConvert(raw_node) -> CNode: converts a raw (type, value, context, children) tree"},
    {"_FreeNodeCount", factory_FreeNodeCount, METH_NOARGS,
     "_FreeNodeCount() -> int: number of nodes on all free lists"},
    {nullptr, nullptr, 0, nullptr}};

} // namespace

PyTypeObject &factoryType() { return FactoryType; }

Ref newNode(ClassInfoObject *Info, PyObject *Value, PyObject *Context, PyObject *Children) {
  // Node operations read these natively: a leaf's text is bytes, the
  // children a list.
  if (Value != Py_None)
    tl::expectType(PyString_Check(Value), "bytes", Value);
  if (Children != Py_None)
    tl::expectType(PyList_Check(Children), "list", Children);
  NodeObject *N = Info->FirstFree;
  if (N) {
    // The record's reference to N passes to the caller; N keeps its own
    // (stale) link to its successor, so the new head gets a reference of its own.
    Info->FirstFree = N->NextFree;
    Py_XINCREF(Info->FirstFree);
    N->OnFreeList = false;
    if (Info->FreeCount > 0)
      --Info->FreeCount;
  } else {
    PyObject *Cls = Info->Cls ? Info->Cls : Py_None;
    PyTypeObject *T = PyType_Check(Cls) ? reinterpret_cast<PyTypeObject *>(Cls) : nullptr;
    if (T && !(T->tp_flags & Py_TPFLAGS_HEAPTYPE) && PyType_IsSubtype(T, &cnodeType())) {
      N = allocNode(T, Info);
    } else {
      PyObject *Made = PyObject_CallFunctionObjArgs(Cls, reinterpret_cast<PyObject *>(Info), nullptr);
      if (!Made)
        throw tl::PyErrSet();
      Ref Hold = Ref::steal(Made);
      if (Made == Py_None)
        tl::raise(PyExc_AttributeError, "'NoneType' object has no attribute 'fText'");
      N = asNode(Made);
      Hold.release();
    }
  }
  PyObject *Text = Value == Py_None ? nullptr : Value;
  PyObject *Kids = Children == Py_None ? nullptr : Children;
  Py_XINCREF(Text);
  Py_XINCREF(Context);
  Py_XINCREF(Kids);
  Py_XSETREF(N->Text, Text);
  Py_XSETREF(N->Context, Context);
  Py_XSETREF(N->Children, Kids);
  return Ref::steal(reinterpret_cast<PyObject *>(N));
}

Ref convertSingleNode(FactoryObject *F, int NodeType, PyObject *Value, PyObject *Context,
                      PyObject *Children) {
  // The engine promotes single children, so a one-child nonterminal never arrives.
  if (!Py_OptimizeFlag && Children != Py_None && PyObject_Size(Children) < 2) {
    if (PyErr_Occurred())
      throw tl::PyErrSet();
    tl::raise(PyExc_AssertionError, "");
  }
  if (!F->ClassInfoList || !F->Keywords)
    tl::raise(PyExc_ValueError, "CNodeFactory is not initialised");
  // The keyword lookup can run Python code (a str subclass's __hash__ or
  // __eq__) that re-initialises F: the dict is held while it is searched and
  // F's fields are read again after it.
  bool Keyword = NodeType == kAwait || NodeType == kAsync;
  if (!Keyword && NodeType == kName && F->KeywordClassInfo && PyString_Check(Value)) {
    Ref Keywords = Ref::borrow(F->Keywords);
    Keyword = PyDict_GetItem(Keywords.get(), Value) != nullptr;
  }
  Ref Info;
  if (Keyword && F->KeywordClassInfo) {
    Info = Ref::borrow(reinterpret_cast<PyObject *>(F->KeywordClassInfo));
  } else {
    if (!F->ClassInfoList)
      tl::raise(PyExc_ValueError, "CNodeFactory is not initialised");
    if (NodeType < 0 || NodeType >= PyList_GET_SIZE(F->ClassInfoList))
      tl::raise(PyExc_IndexError, "list index out of range");
    PyObject *I = PyList_GET_ITEM(F->ClassInfoList, NodeType);
    if (!PyObject_TypeCheck(I, &classInfoType()))
      tl::raiseFormat(PyExc_TypeError, "Cannot convert %.200s to %.200s", Py_TYPE(I)->tp_name,
                      classInfoType().tp_name);
    Info = Ref::borrow(I);
  }
  // A simple statement's NEWLINE: keep the statement, recycle the NEWLINE leaf.
  if (Value == Py_None && Children != Py_None && PyList_Check(Children) && PyList_GET_SIZE(Children) == 2) {
    PyObject *Second = PyList_GET_ITEM(Children, 1);
    if (isNode(Second)) {
      ClassInfoObject *SecondInfo = reinterpret_cast<NodeObject *>(Second)->ClsInfo;
      if (SecondInfo && SecondInfo->NodeType == kNewline) {
        Ref First = Ref::borrow(PyList_GET_ITEM(Children, 0));
        discardNodes(Second, 0);
        return First;
      }
    }
  }
  return newNode(reinterpret_cast<ClassInfoObject *>(Info.get()), Value, Context, Children);
}

void discardNodes(PyObject *Node, int Depth) {
  if (Depth > kMaxDiscardDepth) {
    PySys_WriteStdout("depth too great\n");
    return;
  }
  if (!isNode(Node))
    asNode(Node);
  NodeObject *N = reinterpret_cast<NodeObject *>(Node);
  // A node already on a free list (a tree discarded twice) stays where it is:
  // pushing it again would hand it out twice.
  if (N->OnFreeList)
    return;
  pushFree(N);
  if (!N->Children)
    return;
  // Releasing a stale free-list link can run Python code that changes the
  // children: the list and each child are held while they are walked.
  Ref Kids = Ref::borrow(N->Children);
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Kids.get()); ++I) {
    Ref Kid = Ref::borrow(PyList_GET_ITEM(Kids.get(), I));
    discardNodes(Kid.get(), Depth + 1);
  }
  Py_CLEAR(N->Children);
}

Ref recursiveConvert(FactoryObject *F, PyObject *Raw) {
  tl::NestingGuard Nesting("while converting a raw tree");
  // A tuple of the four items: converting runs Python code (int(), a
  // converter's node class) that may change a list given as the raw node.
  Ref Seq = tl::require(PySequence_Tuple(Raw));
  Py_ssize_t N = PyTuple_GET_SIZE(Seq.get());
  if (N != 4)
    raiseUnpackCount(N, 4);
  PyObject *Type = PyTuple_GET_ITEM(Seq.get(), 0), *Value = PyTuple_GET_ITEM(Seq.get(), 1),
           *Context = PyTuple_GET_ITEM(Seq.get(), 2), *Children = PyTuple_GET_ITEM(Seq.get(), 3);
  Ref TypeNumber = tl::require(PyNumber_Int(Type));
  int NodeType = intArg(TypeNumber.get());
  if (Children == Py_None)
    return convertSingleNode(F, NodeType, Value, Context, Py_None);
  tl::expectType(PyList_Check(Children), "list", Children);
  Ref Converted = tl::require(PyList_New(0));
  for (Py_ssize_t I = 0; I < PyList_GET_SIZE(Children); ++I) {
    Ref Child = Ref::borrow(PyList_GET_ITEM(Children, I));
    tl::expectType(PyTuple_Check(Child.get()), "tuple", Child.get());
    tl::requireStatus(PyList_Append(Converted.get(), recursiveConvert(F, Child.get()).get()));
  }
  return convertSingleNode(F, NodeType, Value, Context, Converted.get());
}

Py_ssize_t factoryFreeNodeCount(FactoryObject *F) {
  Py_ssize_t Count = 0;
  if (F->ClassInfoList)
    for (Py_ssize_t I = 0; I < PyList_GET_SIZE(F->ClassInfoList); ++I) {
      // The list is reachable from Python (through pickling): check each item.
      PyObject *Info = PyList_GET_ITEM(F->ClassInfoList, I);
      if (!PyObject_TypeCheck(Info, &classInfoType()))
        tl::raiseFormat(PyExc_TypeError, "Cannot convert %.200s to %.200s", Py_TYPE(Info)->tp_name,
                        classInfoType().tp_name);
      Count += freeListLength(reinterpret_cast<ClassInfoObject *>(Info));
    }
  if (F->KeywordClassInfo)
    Count += freeListLength(F->KeywordClassInfo);
  return Count;
}

int initFactoryType(PyObject *Module) {
  return tl::guard<int>(-1, [&] {
    tl::TypeDesc D;
    D.Name = "pysource.treelens.CNodeFactory";
    D.Doc = "CNodeFactory(gram, cls_for_nodetype, keywords, tok_number2name)\n\n"
            "Creates the parse tree's nodes for the parser and takes them back onto per-state free "
            "lists when a tree is discarded.";
    D.Size = sizeof(FactoryObject);
    D.Methods = FactoryMethods;
    D.Dealloc = factory_dealloc;
    D.Traverse = factory_traverse;
    D.Clear = factory_clear;
    D.Init = factory_init;
    D.New = PyType_GenericNew;
    tl::requireStatus(tl::readyType(FactoryType, D));
    tl::requireStatus(tl::addType(Module, "CNodeFactory", FactoryType));
    tl::registerPickle(FactoryType,
                       {{"_fClassInfoList", tl::FieldKind::Object, offsetof(FactoryObject, ClassInfoList),
                         &PyList_Type, &classInfoType()},
                        {"_fKeywordClassInfo", tl::FieldKind::Object,
                         offsetof(FactoryObject, KeywordClassInfo), &classInfoType()},
                        {"_fKeywords", tl::FieldKind::Object, offsetof(FactoryObject, Keywords), &PyDict_Type}},
                       host::Host.UnpickleFields);
    return 0;
  });
}

} // namespace treelens
