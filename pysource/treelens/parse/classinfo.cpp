// CNodeClassInfo: the record of one grammar state and the head of its node free list.
#include "pysource/treelens/parse/parse.h"

#include "fieldpickle.h"
#include "pysource/treelens/host/host.h"

#include <structmember.h>

namespace treelens {

using tl::Ref;

namespace {

PyTypeObject ClassInfoType;

ClassInfoObject *self(PyObject *O) { return reinterpret_cast<ClassInfoObject *>(O); }

void checkName(PyObject *Name) {
  if (Name != Py_None)
    tl::expectType(PyString_Check(Name), "bytes", Name);
}

int info_init(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  static const char *Keywords[] = {"cls", "nodetype", "name", nullptr};
  PyObject *Cls, *NodeType, *Name;
  if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "OOO:CNodeClassInfo", const_cast<char **>(Keywords), &Cls,
                                   &NodeType, &Name))
    return -1;
  return tl::guard<int>(-1, [&] {
    long Type = PyInt_AsLong(NodeType);
    if (Type == -1 && PyErr_Occurred())
      throw tl::PyErrSet();
    checkName(Name);
    ClassInfoObject *I = self(Self);
    Py_INCREF(Cls);
    Py_XSETREF(I->Cls, Cls);
    I->NodeType = static_cast<int>(Type);
    Py_XSETREF(I->Name, Name == Py_None ? nullptr : (Py_INCREF(Name), Name));
    drainFreeList(I);
    return 0;
  });
}

int info_traverse(PyObject *Self, visitproc visit, void *arg) {
  ClassInfoObject *I = self(Self);
  Py_VISIT(I->Cls);
  Py_VISIT(I->Name);
  Py_VISIT(I->FirstFree);
  return 0;
}

int info_clear(PyObject *Self) {
  ClassInfoObject *I = self(Self);
  drainFreeList(I);
  Py_CLEAR(I->Cls);
  Py_CLEAR(I->Name);
  return 0;
}

PyObject *orNone(PyObject *O) {
  O = O ? O : Py_None;
  Py_INCREF(O);
  return O;
}

PyObject *info_getCls(PyObject *Self, void *) { return orNone(self(Self)->Cls); }
PyObject *info_getNodeType(PyObject *Self, void *) { return PyInt_FromLong(self(Self)->NodeType); }
PyObject *info_getName(PyObject *Self, void *) { return orNone(self(Self)->Name); }
PyObject *info_getFirstFree(PyObject *Self, void *) {
  return orNone(reinterpret_cast<PyObject *>(self(Self)->FirstFree));
}

PyGetSetDef InfoGetSets[] = {
    {const_cast<char *>("fCls"), info_getCls, nullptr, const_cast<char *>("node class of the state"), nullptr},
    {const_cast<char *>("fNodeType"), info_getNodeType, nullptr,
     const_cast<char *>("state number: token type or grammar symbol number"), nullptr},
    {const_cast<char *>("fName"), info_getName, nullptr,
     const_cast<char *>("state name: grammar symbol or token name"), nullptr},
    {const_cast<char *>("fFirstFree"), info_getFirstFree, nullptr,
     const_cast<char *>("head of the state's free list of discarded nodes"), nullptr},
    {nullptr, nullptr, nullptr, nullptr, nullptr}};

} // namespace

PyTypeObject &classInfoType() { return ClassInfoType; }

Py_ssize_t drainFreeList(ClassInfoObject *Info) {
  Py_ssize_t Count = 0;
  while (NodeObject *N = Info->FirstFree) {
    Info->FirstFree = N->NextFree; // takes over N's reference to its successor
    N->NextFree = nullptr;
    N->OnFreeList = false;
    Py_DECREF(N);
    ++Count;
  }
  Info->FreeCount = 0;
  return Count;
}

// Unpickled links can form a cycle: Brent's algorithm finds one in time
// linear in the list, with no memory.
Py_ssize_t freeListLength(ClassInfoObject *Info) {
  Py_ssize_t Count = 0, Power = 1, Lap = 0;
  NodeObject *Mark = Info->FirstFree;
  for (NodeObject *N = Info->FirstFree; N; N = N->NextFree) {
    ++Count;
    if (Count > 1 && N == Mark)
      tl::raiseFormat(PyExc_ValueError, "the free list of state %d is cyclic", Info->NodeType);
    if (++Lap == Power) {
      Mark = N;
      Power *= 2;
      Lap = 0;
    }
  }
  return Count;
}

Ref newClassInfo(PyObject *Cls, int NodeType, PyObject *Name) {
  checkName(Name);
  Ref I = tl::require(ClassInfoType.tp_alloc(&ClassInfoType, 0));
  ClassInfoObject *Info = self(I.get());
  Py_INCREF(Cls);
  Info->Cls = Cls;
  Info->NodeType = NodeType;
  if (Name != Py_None) {
    Py_INCREF(Name);
    Info->Name = Name;
  }
  return I;
}

int initClassInfoType(PyObject *Module) {
  return tl::guard<int>(-1, [&] {
    tl::TypeDesc D;
    D.Name = "pysource.treelens.CNodeClassInfo";
    D.Doc = "CNodeClassInfo(cls, nodetype, name)\n\n"
            "Grammar state record: the node class to instantiate, the state number, the state name "
            "and the head of the state's free list of discarded nodes.";
    D.Size = sizeof(ClassInfoObject);
    D.GetSets = InfoGetSets;
    D.Dealloc = tl::gcDealloc<info_clear>;
    D.Traverse = info_traverse;
    D.Clear = info_clear;
    D.Init = info_init;
    D.New = PyType_GenericNew;
    tl::requireStatus(tl::readyType(ClassInfoType, D));
    tl::requireStatus(tl::addType(Module, "CNodeClassInfo", ClassInfoType));
    tl::registerPickle(ClassInfoType,
                       {{"fCls", tl::FieldKind::Object, offsetof(ClassInfoObject, Cls)},
                        {"fNodeType", tl::FieldKind::Int, offsetof(ClassInfoObject, NodeType)},
                        {"fName", tl::FieldKind::Object, offsetof(ClassInfoObject, Name), &PyString_Type},
                        {"fFirstFree", tl::FieldKind::Object, offsetof(ClassInfoObject, FirstFree),
                         &cnodeType()}},
                       host::Host.UnpickleFields);
    return 0;
  });
}

} // namespace treelens
