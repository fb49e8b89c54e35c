// CNodeWalker and CDispatchWalker: the class objects; the walk itself records nothing yet.
#include "pysource/treelens/walker/walker.h"

#include "fieldpickle.h"
#include "pysource/treelens/host/host.h"
#include "typedesc.h"

namespace treelens {
namespace walker {

namespace {

PyTypeObject NodeWalkerType;
PyTypeObject DispatchWalkerType;

} // namespace

PyTypeObject &nodeWalkerType() { return NodeWalkerType; }
PyTypeObject &dispatchWalkerType() { return DispatchWalkerType; }

void walk(PyObject *, PyObject *, PyObject *) {}

int initWalkerTypes(PyObject *Module) {
  return tl::guard<int>(-1, [&] {
    tl::TypeDesc D;
    D.Name = "pysource.treelens.CNodeWalker";
    D.Doc = "Symbol walker: visits the tree of one logical line and records the names it defines and uses.";
    D.Size = sizeof(PyObject);
    D.Flags = Py_TPFLAGS_DEFAULT;
    D.New = PyType_GenericNew;
    tl::requireStatus(tl::readyType(NodeWalkerType, D));
    tl::requireStatus(tl::addType(Module, "CNodeWalker", NodeWalkerType));
    tl::registerPickle(NodeWalkerType, {}, host::Host.UnpickleFields);

    D.Name = "pysource.treelens.CDispatchWalker";
    D.Doc = "CDispatchWalker(dispatch_dict)\n\n"
            "Walker that calls the handler its dispatch dict gives for each node's exact class.";
    D.Flags = Py_TPFLAGS_DEFAULT | Py_TPFLAGS_BASETYPE;
    tl::requireStatus(tl::readyType(DispatchWalkerType, D));
    tl::requireStatus(tl::addType(Module, "CDispatchWalker", DispatchWalkerType));
    tl::registerPickle(DispatchWalkerType, {}, host::Host.UnpickleFields);
    return 0;
  });
}

} // namespace walker
} // namespace treelens
