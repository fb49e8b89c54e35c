// Module pysource.optpgen: the native pgen parser engine of the host.
#include "converter.h"
#include "parser.h"
#include "tables.h"

namespace {

using tl::guard;
using tl::Ref;
using tl::require;

/// ParseError keeps lib2to3's signature, attributes and message format, and
/// pickles by its four arguments.
const char *const ParseErrorSource =
    "class ParseError(Exception):\n"
    "    \"\"\"ParseError(msg, type, value, context): the parser cannot go on "
    "with this token.\"\"\"\n"
    "\n"
    "    def __init__(self, msg, type, value, context):\n"
    "        Exception.__init__(self, '%s: type=%r, value=%r, context=%r'\n"
    "                           % (msg, type, value, context))\n"
    "        self.msg = msg\n"
    "        self.type = type\n"
    "        self.value = value\n"
    "        self.context = context\n"
    "\n"
    "    def __reduce__(self):\n"
    "        return (self.__class__,\n"
    "                (self.msg, self.type, self.value, self.context))\n";

PyObject *makeParseError() {
  Ref Globals = require(PyDict_New());
  tl::requireStatus(
      PyDict_SetItemString(Globals.get(), "__builtins__", PyEval_GetBuiltins()));
  Ref Name = require(PyString_FromString("pysource.optpgen"));
  tl::requireStatus(PyDict_SetItemString(Globals.get(), "__name__", Name.get()));
  require(PyRun_String(ParseErrorSource, Py_file_input, Globals.get(),
                       Globals.get()));
  PyObject *Cls = PyDict_GetItemString(Globals.get(), "ParseError");
  if (!Cls)
    tl::raise(PyExc_SystemError, "ParseError was not defined");
  Py_INCREF(Cls);
  return Cls;
}

PyObject *module_tablesbuilt(PyObject *, PyObject *) {
  return PyInt_FromLong(optpgen::tablesBuilt());
}

PyMethodDef ModuleMethods[] = {
    {"CreateParser", optpgen::kwMethod(optpgen::createParser),
     METH_VARARGS | METH_KEYWORDS,
     "CreateParser(grammar, converter, promotesinglechild=False, "
     "maxdepth=kMaxDepth) -> Parser\n\n"
     "converter: a NodeConverter, any object with convert(grammar, "
     "node_type, value, context, children), or None for raw tuples. With "
     "promotesinglechild a nonterminal with exactly one child is replaced "
     "by that child and not converted. maxdepth bounds the nonterminals "
     "open at once."},
    {"_FeedTokens", optpgen::feedTokens, METH_VARARGS,
     "_FeedTokens(parser, tokens) -> bool\n\nparser.setup(), then "
     "parser.addtoken(*t) for each t of tokens until it returns True; "
     "returns the last result."},
    {"_GetTablesBuildCount", module_tablesbuilt, METH_NOARGS,
     "_GetTablesBuildCount() -> number of grammar objects compiled so far"},
    {nullptr, nullptr, 0, nullptr}};

} // namespace

extern "C" __attribute__((visibility("default"))) void initoptpgen() {
  PyObject *M = Py_InitModule3(
      "pysource.optpgen", ModuleMethods,
      "Native pgen parser engine: ParserGenerator, CreateParser, Parser, "
      "NodeConverter, ParseError.\n\n"
      "Parsers follow lib2to3.pgen2.parse.Parser token for token. Beyond it: "
      "at most kMaxDepth nonterminals (a parser's maxdepth) may be open at "
      "once (ParseError 'too much nesting'); a token after the input is complete is a ParseError "
      "'too much input'; after any error, and before the first setup(), "
      "addtoken() raises RuntimeError until setup() is called; convert() may "
      "not call back into its parser (RuntimeError). A grammar object's "
      "tables are compiled once and shared while the object lives.");
  if (!M)
    return;
  guard(0, [&] {
    optpgen::ParseErrorType = makeParseError();
    Py_INCREF(optpgen::ParseErrorType);
    tl::requireStatus(
        PyModule_AddObject(M, "ParseError", optpgen::ParseErrorType));
    if (optpgen::initTables() < 0 || optpgen::initConverters(M) < 0 ||
        optpgen::initParser(M) < 0)
      throw tl::PyErrSet();
    Ref Api = require(
        PyCapsule_New(const_cast<optpgen::ParserApi *>(optpgen::parserApi()),
                      optpgen::kParserCapsuleName, nullptr));
    tl::requireStatus(PyModule_AddObject(M, "_C_API", Api.release()));
    Ref Gen = require(PyImport_ImportModule("pysource._pgengen"));
    Ref Cls = require(PyObject_GetAttrString(Gen.get(), "ParserGenerator"));
    tl::requireStatus(PyModule_AddObject(M, "ParserGenerator", Cls.release()));
    return 0;
  });
}
