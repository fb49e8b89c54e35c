// Module pysource._fastaccess: record operations, tokenizer functions and the native API capsule.
#include "pysource/_fastaccess/internal.h"
#include "pysource/_fastaccess/jointokens.h"
#include "pysource/_fastaccess/linetable.h"
#include "pysource/_fastaccess/literals.h"
#include "pysource/_fastaccess/records.h"

#include "typedesc.h"

namespace fastaccess {

using tl::guard;
using tl::Ref;
using tl::require;

namespace {

/// Data of a bytes argument.
void bytesArg(PyObject *O, const char **Text, Py_ssize_t *Len) {
  expectBytes(O);
  *Text = PyString_AS_STRING(O);
  *Len = PyString_GET_SIZE(O);
}

PyObject *noneOr(int Status) {
  if (Status < 0)
    return nullptr;
  Py_RETURN_NONE;
}

PyObject *f_clear(PyObject *, PyObject *Logical) { return noneOr(clearDerivedInfo(Logical)); }

PyObject *f_append_attrib(PyObject *, PyObject *Args) {
  PyObject *Logical, *Attrib;
  if (!PyArg_ParseTuple(Args, "OO:AppendLogicalAttrib", &Logical, &Attrib))
    return nullptr;
  return noneOr(appendAttrib(Logical, Attrib));
}

PyObject *f_append_type_equiv(PyObject *, PyObject *Args) {
  PyObject *Logical, *Name, *Info;
  if (!PyArg_ParseTuple(Args, "OOO:AppendLogicalTypeEquiv", &Logical, &Name, &Info))
    return nullptr;
  return noneOr(appendTypeEquiv(Logical, Name, Info));
}

PyObject *f_logical_token_type(PyObject *, PyObject *Args) {
  return guard<PyObject *>(nullptr, [&]() -> PyObject * {
    PyObject *Logical;
    Py_ssize_t I;
    if (!PyArg_ParseTuple(Args, "On:GetLogicalTokenType", &Logical, &I))
      return nullptr;
    LogicalLineObject *L = asLogical(Logical);
    if (I < 0 || I >= L->TokenCount)
      tl::raise(PyExc_IndexError, msg::Index);
    return PyInt_FromLong(L->Types[I]);
  });
}

/// (texts, rows, cols): three lists over a record's tokens, in one call, so
/// callers that read every token build no per-token tuples.
PyObject *f_logical_token_table(PyObject *, PyObject *Logical) {
  return guard<PyObject *>(nullptr, [&] {
    LogicalLineObject *L = asLogical(Logical);
    const Py_ssize_t N = L->TokenCount;
    Ref Texts = require(PyList_New(N));
    Ref Rows = require(PyList_New(N));
    Ref Cols = require(PyList_New(N));
    for (Py_ssize_t I = 0; I < N; ++I) {
      PyObject *Text = L->Texts[I] ? L->Texts[I] : Py_None;
      Py_INCREF(Text);
      PyList_SET_ITEM(Texts.get(), I, Text);
      PyList_SET_ITEM(Rows.get(), I, require(PyInt_FromLong(L->Positions[I].Row)).release());
      PyList_SET_ITEM(Cols.get(), I, require(PyInt_FromLong(L->Positions[I].Col)).release());
    }
    return require(PyTuple_Pack(3, Texts.get(), Rows.get(), Cols.get())).release();
  });
}

PyObject *f_logical_line_table(PyObject *, PyObject *Logical) {
  return guard<PyObject *>(nullptr, [&] { return lineTable(Logical).release(); });
}

PyObject *f_line_name_columns(PyObject *, PyObject *Args) {
  return guard<PyObject *>(nullptr, [&]() -> PyObject * {
    PyObject *Logical, *Defines, *Reads;
    if (!PyArg_ParseTuple(Args, "OOO:LineNameColumns", &Logical, &Defines, &Reads))
      return nullptr;
    return lineNameColumns(Logical, Defines, Reads).release();
  });
}

PyObject *f_token_type(PyObject *, PyObject *Text) {
  return guard<PyObject *>(nullptr, [&] {
    const char *Buf;
    Py_ssize_t Len;
    bytesArg(Text, &Buf, &Len);
    return PyInt_FromLong(tokenTypeOfText(Buf, Len));
  });
}

PyObject *f_tokenize(PyObject *, PyObject *Text) {
  return guard<PyObject *>(nullptr, [&] {
    const char *Buf;
    Py_ssize_t Len;
    bytesArg(Text, &Buf, &Len);
    return tokenizeText(Buf, Len);
  });
}

PyObject *f_split(PyObject *, PyObject *Text) {
  return guard<PyObject *>(nullptr, [&] {
    const char *Buf;
    Py_ssize_t Len;
    bytesArg(Text, &Buf, &Len);
    return splitText(Buf, Len);
  });
}

PyObject *f_find_string_end(PyObject *, PyObject *Args) {
  return guard<PyObject *>(nullptr, [&]() -> PyObject * {
    PyObject *Text;
    Py_ssize_t Pos;
    if (!PyArg_ParseTuple(Args, "On:_FindStringEndNonNested", &Text, &Pos))
      return nullptr;
    const char *Buf;
    Py_ssize_t Len;
    bytesArg(Text, &Buf, &Len);
    if (Pos >= 0 && Pos < Len) {
      Py_ssize_t Quote = Pos;
      while (Quote < Len && Quote - Pos < 2 && Buf[Quote] != '\'' && Buf[Quote] != '"')
        ++Quote;
      if (Quote < Len && (Buf[Quote] == '\'' || Buf[Quote] == '"') &&
          (Quote == Pos || tokcore::isStringPrefix(Buf + Pos, static_cast<size_t>(Quote - Pos))))
        return PyInt_FromSsize_t(static_cast<Py_ssize_t>(
            tokcore::findStringEnd(Buf, static_cast<size_t>(Len), static_cast<size_t>(Quote))));
    }
    tl::raiseFormat(PyExc_ValueError, msg::NoString, Pos);
  });
}

PyObject *f_clear_free_list(PyObject *, PyObject *) {
  return PyInt_FromLong(clearLogicalFreeList());
}

PyMethodDef Functions[] = {
    {"EncodeStringLiteral", f_encode_string_literal, METH_O,
     "EncodeStringLiteral(text) -> bytes: the compact form of a string literal token (see symbolinfo)."},

    {"ClearLogicalDerivedInfo", f_clear, METH_O,
     "ClearLogicalDerivedInfo(logical): empties the derived-info lists."},
    {"AppendLogicalAttrib", f_append_attrib, METH_VARARGS,
     "AppendLogicalAttrib(logical, attrib): attrib is a name, appended to fNamesDefined,\n"
     "or a (name, info) pair: the name goes to fNamesDefined and the pair to fTypeEquivs."},
    {"AppendLogicalTypeEquiv", f_append_type_equiv, METH_VARARGS,
     "AppendLogicalTypeEquiv(logical, name, info): appends (name, info) to fTypeEquivs."},
    {"GetLogicalTokenType", f_logical_token_type, METH_VARARGS,
     "GetLogicalTokenType(logical, i) -> int: the type code of token i."},
    {"GetLogicalTokenTable", f_logical_token_table, METH_O,
     "GetLogicalTokenTable(logical) -> (texts, rows, cols): lists of the tokens' texts and\n"
     "0-based positions (row within the record)."},
    {"GetLogicalLineTable", f_logical_line_table, METH_O,
     "GetLogicalLineTable(logical) -> (texts, lines, cols, comments, match, ascii): the texts\n"
     "and 1-based positions of the tokens that are not comments or line continuations,\n"
     "[(line, col, text)] of the comments, {index of an opening bracket: index of the\n"
     "bracket that closes it, or len(texts)}, and whether the line text is all ASCII."},
    {"LineNameColumns", f_line_name_columns, METH_VARARGS,
     "LineNameColumns(logical, defines, reads) -> (defines_at, reads_at): the 1-based\n"
     "(line, col) of each name in the record's tokens, or None (see resolver.LineNames)."},
    {"GetTokenType", f_token_type, METH_O,
     "GetTokenType(text) -> int: the type code of the token that text begins with."},
    {"Tokenize", f_tokenize, METH_O,
     "Tokenize(text) -> list of token texts, comments and backslashes included."},
    {"_FindStringEndNonNested", f_find_string_end, METH_VARARGS,
     "_FindStringEndNonNested(text, pos) -> int\n\n"
     "The offset just past the string literal that starts at pos (its prefix or\n"
     "opening quote), or len(text) when it is unterminated. Quotes inside f-string\n"
     "replacement fields do not nest. ValueError when no literal starts at pos."},
    {"JoinTokens", reinterpret_cast<PyCFunction>(reinterpret_cast<void (*)()>(f_join_tokens)),
     METH_VARARGS | METH_KEYWORDS,
     "JoinTokens(texts) -> bytes: the token texts joined into source text with conventional spacing."},
    {"_ClearLogicalFreeList", f_clear_free_list, METH_NOARGS,
     "_ClearLogicalFreeList() -> int: frees the dead records kept for reuse, returns their number."},
    {"_SplitLogicals", f_split, METH_O,
     "_SplitLogicals(text) -> list of CLogicalLine, parents linked."},
    {nullptr, nullptr, 0, nullptr}};

/// The capsule's table; filled once at import.
Api TheApi;

int addTypes(PyObject *M) {
  if (initLogicalLineType() < 0 || initBytesTokenizerType() < 0 || initLoggerType() < 0)
    return -1;
  if (tl::addType(M, "CLogicalLine", LogicalLineType) < 0 ||
      tl::addType(M, "LogicalLineType", LogicalLineType) < 0 ||
      tl::addType(M, "CBytesTokenizer", BytesTokenizerType) < 0 ||
      tl::addType(M, "CLogger", LoggerType) < 0)
    return -1;
  return 0;
}

void init(PyObject *M) {
  if (initTokenTextCache() < 0 || addTypes(M) < 0)
    throw tl::PyErrSet();
  Ref Time = require(PyImport_ImportModule("time"));
  Ref TimeFunc = require(PyObject_GetAttrString(Time.get(), "time"));
  tl::requireStatus(PyModule_AddObject(M, "__TimeFunc", TimeFunc.release()));
  TheApi.Version = kApiVersion;
  TheApi.LogicalLineType = &LogicalLineType;
  TheApi.TokenTypeOfText = tokenTypeOfText;
  TheApi.ClearDerivedInfo = clearDerivedInfo;
  TheApi.AppendAttrib = appendAttrib;
  TheApi.AppendTypeEquiv = appendTypeEquiv;
  TheApi.Tokenize = tokenizeText;
  TheApi.SplitLogicals = splitText;
  Ref Capsule = require(PyCapsule_New(&TheApi, kCapsuleName, nullptr));
  tl::requireStatus(PyModule_AddObject(M, "_C_API", Capsule.release()));
}

} // namespace

} // namespace fastaccess

extern "C" __attribute__((visibility("default"))) void init_fastaccess() {
  PyObject *M = Py_InitModule3("_fastaccess", fastaccess::Functions,
                               "Logical-line records and the byte tokenizer of the host.");
  if (!M)
    return;
  tl::guard(0, [&] {
    fastaccess::init(M);
    return 0;
  });
}
