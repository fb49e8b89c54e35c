// CFStringSupport: the class object; f-string expressions are not inspected yet.
#include "pysource/treelens/fstrings/fstrings.h"

#include "fieldpickle.h"
#include "pysource/treelens/host/host.h"
#include "typedesc.h"

namespace treelens {
namespace fstrings {

namespace {

PyTypeObject FStringSupportType;

} // namespace

PyTypeObject &fstringSupportType() { return FStringSupportType; }

void inspectFStringTokens(PyObject *, PyObject *, bool) {}

int initFStringTypes(PyObject *Module) {
  return tl::guard<int>(-1, [&] {
    tl::TypeDesc D;
    D.Name = "pysource.treelens.CFStringSupport";
    D.Doc = "Splits f-string tokens into parts and their expressions into logical lines.\n\n"
            "Operations return lists rather than iterators; the class keeps no state besides four "
            "constants.";
    D.Size = sizeof(PyObject);
    D.New = PyType_GenericNew;
    tl::requireStatus(tl::readyType(FStringSupportType, D));
    tl::requireStatus(tl::addType(Module, "CFStringSupport", FStringSupportType));
    tl::registerPickle(FStringSupportType, {}, host::Host.UnpickleFields);
    return 0;
  });
}

} // namespace fstrings
} // namespace treelens
