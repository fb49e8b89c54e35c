// CTypeHintWalker: the class object; the walk itself records nothing yet.
#include "pysource/treelens/hints/hints.h"

#include "fieldpickle.h"
#include "pysource/treelens/host/host.h"
#include "pysource/treelens/walker/walker.h"
#include "typedesc.h"

namespace treelens {
namespace hints {

namespace {

PyTypeObject TypeHintWalkerType;

/// Accepts the constructor arguments; the walker records nothing yet.
int hintWalkerInit(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<int>(-1, [&] {
    static const char *Keywords[] = {"version_triple", "grammar_file", nullptr};
    PyObject *Version, *Grammar = Py_None;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "O|O:CTypeHintWalker", const_cast<char **>(Keywords), &Version,
                                     &Grammar))
      throw tl::PyErrSet();
    tl::Ref Dict = tl::require(PyDict_New());
    walker::dispatchWalkerSetUp(reinterpret_cast<walker::DispatchWalkerObject *>(Self), Dict.get());
    return 0;
  });
}

} // namespace

PyTypeObject &typeHintWalkerType() { return TypeHintWalkerType; }

void walk(PyObject *, PyObject *, PyObject *) {}

int initHintTypes(PyObject *Module) {
  return tl::guard<int>(-1, [&] {
    tl::TypeDesc D;
    D.Name = "pysource.treelens.CTypeHintWalker";
    D.Doc = "CTypeHintWalker(version_triple, grammar_file)\n\n"
            "Records the type hints of annotations and type comments of one logical line.";
    D.Size = sizeof(walker::DispatchWalkerObject);
    D.Base = &walker::dispatchWalkerType();
    D.Flags = Py_TPFLAGS_DEFAULT | Py_TPFLAGS_HAVE_GC;
    D.Dealloc = tl::gcDealloc<walker::dispatchWalkerClear>;
    D.Traverse = walker::dispatchWalkerTraverse;
    D.Clear = walker::dispatchWalkerClear;
    D.Init = hintWalkerInit;
    D.New = PyType_GenericNew;
    tl::requireStatus(tl::readyType(TypeHintWalkerType, D));
    tl::requireStatus(tl::addType(Module, "CTypeHintWalker", TypeHintWalkerType));
    return 0;
  });
}

} // namespace hints
} // namespace treelens
