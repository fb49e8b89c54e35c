// Module start-up: host bindings, constants, classes and functions of pysource.treelens.
#include "pysource/treelens/front/front.h"

#include "fieldpickle.h"
#include "pysource/treelens/fstrings/fstrings.h"
#include "pysource/treelens/hints/hints.h"
#include "pysource/treelens/host/host.h"
#include "pysource/treelens/nodes/args.h"
#include "pysource/treelens/nodes/records.h"
#include "pysource/treelens/nodes/stmt.h"
#include "pysource/treelens/nodes/totext.h"
#include "pysource/treelens/nodes/utils.h"
#include "pysource/treelens/walker/walker.h"

namespace treelens {

using host::Host;
using host::Sym;
using tl::Ref;

namespace {

const char ModuleDoc[] =
    " treelens -- pgen based inspection of Python source code\n\n"
    "Analyses Python source one logical line at a time: parses the line's tokens with a pgen grammar "
    "for the target language version, builds a tree of typed nodes recycled through per-state free "
    "lists, and records in the host's logical-line record what the line defines and uses. The host "
    "builds one CPGenAnalyzerImpl per language version and calls its AnalyzeSingleLogical.";

PyMethodDef NoFunctions[] = {{nullptr, nullptr, 0, nullptr}};

void addFunctions(PyObject *Module, PyMethodDef *Defs) {
  Ref Name = tl::require(PyString_FromString(PyModule_GetName(Module)));
  for (PyMethodDef *D = Defs; D->ml_name; ++D) {
    Ref F = tl::require(PyCFunction_NewEx(D, nullptr, Name.get()));
    tl::requireStatus(PyDict_SetItemString(Host.ModuleDict, D->ml_name, F.get()));
  }
}

void setConstant(const char *Name, Ref Value) {
  tl::requireStatus(PyDict_SetItemString(Host.ModuleDict, Name, Value.get()));
}

Ref bytes(const char *S) { return tl::require(PyString_FromString(S)); }

/// kTypedLiteralPrefix + Middle + Suffix.
Ref literalName(const char *Middle, PyObject *Suffix) {
  Ref Head = tl::require(PyNumber_Add(host::sym(Sym::kTypedLiteralPrefix), bytes(Middle).get()));
  return tl::require(PyNumber_Add(Head.get(), Suffix));
}

void setConstants() {
  setConstant("kMimicAstInspectBugs", Ref::borrow(Py_True));
  setConstant("kPy2DefaultGrammar", bytes("Python-Grammar-2.7"));
  setConstant("kPy3DefaultGrammar", bytes("Python-Grammar-3.6"));
  Ref InstanceSuffix = bytes(":");
  setConstant("kInstanceSuffix", Ref::borrow(InstanceSuffix.get()));
  PyObject *ClassSuffix = host::sym(Sym::kClassInstanceSuffix);
  setConstant("kListInstanceName", literalName("list", InstanceSuffix.get()));
  setConstant("kDictInstanceName", literalName("dict", InstanceSuffix.get()));
  setConstant("kSetInstanceName", literalName("set", InstanceSuffix.get()));
  setConstant("kTupleInstanceName", literalName("tuple", InstanceSuffix.get()));
  setConstant("kStringInstanceName", literalName("string", InstanceSuffix.get()));
  setConstant("kUnicodeInstanceName", literalName("unicode", InstanceSuffix.get()));
  setConstant("kIntLiteralName", literalName("int", ClassSuffix));
  setConstant("kFloatLiteralName", literalName("float", ClassSuffix));
  setConstant("kLiteralPrefix", Ref::borrow(host::sym(Sym::kTypedLiteralPrefix)));
}

void initModule() {
  PyObject *Module = Py_InitModule3("treelens", NoFunctions, ModuleDoc);
  if (!Module)
    throw tl::PyErrSet();
  host::bindHost(Module);
  setConstants();

  static PyMethodDef Unpickle = tl::unpickleMethodDef();
  Ref Name = tl::require(PyString_FromString(PyModule_GetName(Module)));
  Ref UnpickleFunc = tl::require(PyCFunction_NewEx(&Unpickle, nullptr, Name.get()));
  tl::requireStatus(PyDict_SetItemString(Host.ModuleDict, Unpickle.ml_name, UnpickleFunc.get()));
  Host.UnpickleFields = UnpickleFunc.release();

  tl::requireStatus(initClassInfoType(Module));
  tl::requireStatus(initNodeTypes(Module));
  tl::requireStatus(initNodeRecordTypes(Module));
  tl::requireStatus(initNodeToTextType(Module));
  tl::requireStatus(initFactoryType(Module));
  tl::requireStatus(walker::initWalkerTypes(Module));
  tl::requireStatus(initAnalyzerBaseType(Module));
  tl::requireStatus(initParserType(Module));
  tl::requireStatus(hints::initHintTypes(Module));
  tl::requireStatus(initAnalyzerType(Module));
  tl::requireStatus(fstrings::initFStringTypes(Module));

  addFunctions(Module, SyntaxErrorFunctions);
  addFunctions(Module, host::RecordFunctions);
  addFunctions(Module, host::SymbolInfoFunctions);
  addFunctions(Module, NodeUtilFunctions);
  addFunctions(Module, ArgListFunctions);
  addFunctions(Module, StmtFunctions);
}

} // namespace

} // namespace treelens

// A failed start-up leaves no half-made module behind for the next import.
extern "C" __attribute__((visibility("default"))) void inittreelens() {
  if (tl::guard<int>(-1, [] {
        treelens::initModule();
        return 0;
      }) == 0)
    return;
  PyObject *Type, *Value, *Tb;
  PyErr_Fetch(&Type, &Value, &Tb);
  PyObject *Modules = PyImport_GetModuleDict();
  const char *Name = treelens::host::Host.Module ? PyModule_GetName(treelens::host::Host.Module) : nullptr;
  if (Name && PyDict_GetItemString(Modules, Name))
    PyDict_DelItemString(Modules, Name);
  PyErr_Clear();
  PyErr_Restore(Type, Value, Tb);
}
