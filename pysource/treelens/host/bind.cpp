// Import-time bindings to the host modules and the standard library.
#include "pysource/treelens/host/host.h"

namespace treelens {
namespace host {

using tl::Ref;

Bindings Host;

namespace {

/// Imports a module by name with the module's globals (Level -1 also tries
/// the module's own package first, as a plain import inside a package does).
Ref importModule(const char *Name, int Level, PyObject *FromList = nullptr) {
  return tl::require(PyImport_ImportModuleLevel(const_cast<char *>(Name), Host.ModuleDict, nullptr,
                                                FromList, Level));
}

/// `from Package import Name`.
Ref importFrom(const char *Package, const char *Name) {
  Ref From = tl::require(Py_BuildValue("(s)", Name));
  Ref Pkg = importModule(Package, 0, From.get());
  PyObject *Attr = PyObject_GetAttrString(Pkg.get(), Name);
  if (!Attr) {
    PyErr_Clear();
    tl::raiseFormat(PyExc_ImportError, "cannot import name %s", Name);
  }
  return Ref::steal(Attr);
}

/// Attribute Name of Module, as `from module import Name`: ImportError when missing.
PyObject *take(PyObject *Module, const char *Name) {
  PyObject *Attr = PyObject_GetAttrString(Module, Name);
  if (!Attr) {
    if (!PyErr_ExceptionMatches(PyExc_AttributeError))
      throw tl::PyErrSet();
    PyErr_Clear();
    tl::raiseFormat(PyExc_ImportError, "cannot import name %s", Name);
  }
  return Attr;
}

PyTypeObject *takeType(PyObject *Module, const char *Name) {
  PyObject *T = take(Module, Name);
  if (!PyType_Check(T)) {
    Py_DECREF(T);
    tl::raiseFormat(PyExc_ImportError, "%s is not a type", Name);
  }
  return reinterpret_cast<PyTypeObject *>(T);
}

/// Binds Value under Name in the module namespace.
void bind(const char *Name, PyObject *Value) {
  tl::requireStatus(PyDict_SetItemString(Host.ModuleDict, Name, Value));
}

} // namespace

char kindByte(PyObject *O, const char *What) {
  if (PyString_Check(O) && PyString_GET_SIZE(O) == 1)
    return PyString_AS_STRING(O)[0];
  if (PyInt_Check(O)) {
    long V = PyInt_AS_LONG(O);
    if (V >= 0 && V < 256)
      return static_cast<char>(V);
  }
  tl::raiseFormat(PyExc_ImportError, "symbolinfo.%s is not one byte", What);
}

void bindHost(PyObject *Module) {
  Host.Module = Module;
  Host.ModuleDict = PyModule_GetDict(Module);

  for (const char *Name : {"keyword", "re", "sys", "token"})
    bind(Name, importModule(Name, 0).get());
  Ref Os = importModule("os.path", 0);
  bind("os", Os.get());
  Ref Time = importModule("time", 0);
  bind("time", Time.get());
  Ref Pgen = importFrom("lib2to3.pgen2", "pgen");
  bind("pgen", Pgen.get());
  Ref FastAccess = importModule("_fastaccess", -1);
  bind("_fastaccess", FastAccess.get());
  Ref Config = importModule("config", -1);
  bind("config", Config.get());
  Ref LogicalLine = importFrom("parsetools", "logicalline");
  bind("logicalline", LogicalLine.get());
  Ref SymbolInfo = importFrom("pysource", "symbolinfo");
  bind("symbolinfo", SymbolInfo.get());
  Ref LogicalInspect = importModule("logicalinspect", -1);
  bind("logicalinspect", LogicalInspect.get());
  Ref Reflect = importFrom("loomutils", "reflect");
  bind("reflect", Reflect.get());
  Ref Pysource = importModule("pysource.optpgen", 0);
  bind("pysource", Pysource.get());

  Host.Config = Config.release();
  Host.LogicalLine = LogicalLine.release();
  Host.LogicalInspect = LogicalInspect.release();
  Host.Reflect = Reflect.release();

  // pysource.optpgen
  Ref OptPgen = Ref::steal(take(Pysource.get(), "optpgen"));
  Host.ParserType = takeType(OptPgen.get(), "Parser");
  Host.NodeConverterType = takeType(OptPgen.get(), "NodeConverter");
  Host.ParseError = take(OptPgen.get(), "ParseError");
  Host.ParserGenerator = take(OptPgen.get(), "ParserGenerator");
  Host.CreateParser = take(OptPgen.get(), "CreateParser");
  Host.ParserApi = nullptr;
  if (PyObject_HasAttrString(OptPgen.get(), "_C_API")) {
    void *P = PyCapsule_Import(const_cast<char *>(optpgen::kParserCapsuleName), 0);
    if (!P)
      throw tl::PyErrSet();
    const auto *Api = static_cast<const optpgen::ParserApi *>(P);
    if (Api->Version == optpgen::kParserApiVersion && Api->ParserType == Host.ParserType)
      Host.ParserApi = Api;
  }

  // pysource._fastaccess
  Host.Fast = fastaccess::importFastAccessApi();
  if (!Host.Fast)
    throw tl::PyErrSet();
  Host.CLogger = take(FastAccess.get(), "CLogger");
  Host.CBytesTokenizer = take(FastAccess.get(), "CBytesTokenizer");
  Host.LogicalLineType = takeType(FastAccess.get(), "LogicalLineType");
  if (Host.LogicalLineType != Host.Fast->LogicalLineType)
    tl::raise(PyExc_ImportError, "_fastaccess.LogicalLineType differs from its native API's type");
  Host.TimeFunc = take(FastAccess.get(), "__TimeFunc");
  Host.ClearLogicalDerivedInfo = take(FastAccess.get(), "ClearLogicalDerivedInfo");
  Host.AppendLogicalAttrib = take(FastAccess.get(), "AppendLogicalAttrib");
  Host.AppendLogicalTypeEquiv = take(FastAccess.get(), "AppendLogicalTypeEquiv");
  Host.GetLogicalTokenType = take(FastAccess.get(), "GetLogicalTokenType");
  Host.GetTokenType = take(FastAccess.get(), "GetTokenType");
  Host.Tokenize = take(FastAccess.get(), "Tokenize");
  Host.FindStringEndNonNested = take(FastAccess.get(), "_FindStringEndNonNested");

  // pysource.symbolinfo
  Host.CSingleResolvedInfo = take(SymbolInfo.get(), "CSingleResolvedInfo");
  Host.CFullyScopedName = take(SymbolInfo.get(), "CFullyScopedName");
  Host.CDefInfo = take(SymbolInfo.get(), "CDefInfo");
#define TL_SYM_TAKE(Name) Host.SymValues[static_cast<int>(Sym::Name)] = take(SymbolInfo.get(), #Name);
  TL_SYMBOLINFO_CONSTANTS(TL_SYM_TAKE)
#undef TL_SYM_TAKE
  Host.EncodeStringLiteral = take(SymbolInfo.get(), "EncodeStringLiteral");
  Host.BuildLiteralInfo = take(SymbolInfo.get(), "BuildLiteralInfo");
  Host.PlainEquivKind = kindByte(sym(Sym::kPlainEquivKind), "kPlainEquivKind");
  Host.FunctionKind = kindByte(sym(Sym::kFunctionKind), "kFunctionKind");
  Host.MethodKind = kindByte(sym(Sym::kMethodKind), "kMethodKind");
  Host.UnboundMethodKind = kindByte(sym(Sym::kUnboundMethodKind), "kUnboundMethodKind");

  // Standard library
  Host.KeywordList = take(PyDict_GetItemString(Host.ModuleDict, "keyword"), "kwlist");
  Host.TokName = take(PyDict_GetItemString(Host.ModuleDict, "token"), "tok_name");
  Ref Grammar = Ref::steal(take(Pgen.get(), "grammar"));
  Host.OpMap = take(Grammar.get(), "opmap");
  Ref Path = Ref::steal(take(Os.get(), "path"));
  Host.IsAbs = take(Path.get(), "isabs");
  Host.TimeTime = take(Time.get(), "time");
}

Py_ssize_t takeParseErrorContext() {
  PyObject *Type, *Value, *Tb;
  PyErr_Fetch(&Type, &Value, &Tb);
  PyErr_NormalizeException(&Type, &Value, &Tb);
  Ref HoldType = Ref::steal(Type), HoldValue = Ref::steal(Value), HoldTb = Ref::steal(Tb);
  Ref Context = tl::require(PyObject_GetAttrString(Value ? Value : Py_None, "context"));
  Py_ssize_t TokI = PyNumber_AsSsize_t(Context.get(), PyExc_OverflowError);
  if (TokI == -1 && PyErr_Occurred())
    throw tl::PyErrSet();
  return TokI;
}

} // namespace host
} // namespace treelens
