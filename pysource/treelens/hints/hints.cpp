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

} // namespace

PyTypeObject &typeHintWalkerType() { return TypeHintWalkerType; }

void walk(PyObject *, PyObject *, PyObject *) {}

int initHintTypes(PyObject *Module) {
  return tl::guard<int>(-1, [&] {
    tl::TypeDesc D;
    D.Name = "pysource.treelens.CTypeHintWalker";
    D.Doc = "CTypeHintWalker(version_triple, grammar_file)\n\n"
            "Records the type hints of annotations and type comments of one logical line.";
    D.Size = sizeof(PyObject);
    D.Base = &walker::dispatchWalkerType();
    D.Flags = Py_TPFLAGS_DEFAULT;
    D.New = PyType_GenericNew;
    tl::requireStatus(tl::readyType(TypeHintWalkerType, D));
    tl::requireStatus(tl::addType(Module, "CTypeHintWalker", TypeHintWalkerType));
    return 0;
  });
}

} // namespace hints
} // namespace treelens
