// The host interface: bindings to the host modules, logical-line record operations, symbol-info constants.
#ifndef TREELENS_HOST_HOST_H
#define TREELENS_HOST_HOST_H

#include "pyref.h"
#include "pysource/_fastaccess/fastaccess_api.h"
#include "pysource/optpgen/optpgen_api.h"

namespace treelens {
namespace host {

/// Symbol-info constants of pysource.symbolinfo, in the order they are imported.
#define TL_SYMBOLINFO_CONSTANTS(X)                                                                 \
  X(kGetPrefix) X(kWithinExprPrefix) X(kGlobalPrefix) X(kNonlocalPrefix) X(kImportPrefix)         \
  X(kFromImportPrefix) X(kImportAsNamePrefix) X(kCalledPrefix) X(kTypedLiteralPrefix)             \
  X(kIterationSubscript) X(kClassInstanceSuffix) X(kTypeHintPrefix) X(kFunctionKind)              \
  X(kMethodKind) X(kUnboundMethodKind) X(kPlainEquivKind) X(kSetPrefix) X(kSetKind) X(kGetKind)   \
  X(kSetTypeHintPrefix) X(kSetTypeHintKind) X(kNonlocalKind) X(kGlobalKind) X(kWithinExprKind)    \
  X(kImportKind) X(kFromImportKind) X(kImportAsNameKind) X(kDecoratorPrefix) X(kDecoratorKind)    \
  X(kSpecificScopePrefix) X(kSpecificScopeKind) X(kSpecificUrlPrefix) X(kSpecificUrlKind)         \
  X(kBuiltinModulePrefix) X(kBuiltinModuleKind) X(kTypingModulePrefix) X(kTypingModuleKind)       \
  X(kBuiltinClassPrefix) X(kBuiltinClassKind) X(kTypedLiteralKind) X(kArgPrefix) X(kArgKind)      \
  X(kTypeHintKind) X(kPlainEquivSpec) X(kMethodPrefix) X(kUnboundMethodPrefix)                    \
  X(kFunctionPrefix) X(kClassPrefix) X(kClassKind) X(kSelfPrefix) X(kSelfKind)                    \
  X(kInstancePrefix) X(kInstanceKind) X(kModulePrefix) X(kModuleKind)                             \
  X(kInferredTypeHintPrefix) X(kInferredTypeHintKind) X(kCalledKind) X(kTypingModuleSymbol)       \
  X(kTypingModuleSymbolDot) X(kTypingModuleSymbolDotAny) X(kPrefixLen) X(kScopeIndexSep)          \
  X(kModuleScopeName)

enum class Sym : int {
#define TL_SYM_ENUM(Name) Name,
  TL_SYMBOLINFO_CONSTANTS(TL_SYM_ENUM)
#undef TL_SYM_ENUM
      Count
};

/// Everything the module takes from its host, bound once at import. All
/// object pointers are owned for the life of the process.
struct Bindings {
  PyObject *Module;     ///< pysource.treelens itself (borrowed)
  PyObject *ModuleDict; ///< its namespace (borrowed)

  // pysource._fastaccess
  const fastaccess::Api *Fast;
  PyTypeObject *LogicalLineType;
  PyObject *TimeFunc; ///< __TimeFunc
  PyObject *ClearLogicalDerivedInfo, *AppendLogicalAttrib, *AppendLogicalTypeEquiv,
      *GetLogicalTokenType, *GetTokenType, *Tokenize, *FindStringEndNonNested;
  PyObject *CLogger, *CBytesTokenizer;

  // pysource.optpgen
  const optpgen::ParserApi *ParserApi; ///< nullptr when the engine publishes none
  PyTypeObject *ParserType, *NodeConverterType;
  PyObject *ParseError, *ParserGenerator, *CreateParser;

  // pysource.symbolinfo
  PyObject *SymValues[static_cast<int>(Sym::Count)];
  PyObject *EncodeStringLiteral, *BuildLiteralInfo;
  PyObject *CSingleResolvedInfo, *CFullyScopedName, *CDefInfo;
  char PlainEquivKind, FunctionKind, MethodKind, UnboundMethodKind;

  // Host Python modules; their functions are looked up when called.
  PyObject *Config;         ///< config (GetLoomFilename)
  PyObject *LogicalLine;    ///< parsetools.logicalline (LogicalLineType)
  PyObject *LogicalInspect; ///< pysource.logicalinspect (TextFromTokens)
  PyObject *Reflect;        ///< loomutils.reflect (ReportCurrentException)

  // Standard library
  PyObject *KeywordList; ///< keyword.kwlist
  PyObject *TokName;     ///< token.tok_name
  PyObject *OpMap;       ///< lib2to3.pgen2 grammar opmap
  PyObject *IsAbs;       ///< os.path.isabs
  PyObject *TimeTime;    ///< time.time

  PyObject *UnpickleFields; ///< the module's _UnpickleFields
};

TL_HIDDEN extern Bindings Host;

/// Imports the host modules into Host and binds them in the module namespace,
/// in the documented order. Throws PyErrSet (an ImportError for anything missing).
TL_HIDDEN void bindHost(PyObject *Module);

/// The token index (the `context`) of the pending optpgen ParseError, which
/// it clears. Throws PyErrSet when the context is not an index.
TL_HIDDEN Py_ssize_t takeParseErrorContext();

/// The symbol-info constant Name (borrowed).
inline PyObject *sym(Sym Name) { return Host.SymValues[static_cast<int>(Name)]; }

// ---- Logical-line records ----

using fastaccess::LogicalLineObject;

/// True exactly when type(O) is the host's logical-line type.
inline bool isLogical(PyObject *O) {
  return Py_TYPE(O) == Host.LogicalLineType;
}

/// RaiseIfNotLogical: raises TypeError "Argument must be a logical" unless O is
/// exactly a logical-line record; returns it.
TL_HIDDEN LogicalLineObject *requireLogical(PyObject *O);

/// Like requireLogical, with the argument-check message for a named parameter.
TL_HIDDEN LogicalLineObject *requireLogicalArg(PyObject *O, const char *ArgName);

/// GetLogicalTokenText: borrowed token text, Py_None for an empty slot; raises
/// IndexError "Index not in range" outside [0, fTokenCount).
TL_HIDDEN PyObject *logicalTokenText(LogicalLineObject *L, Py_ssize_t I);

/// GetLocalScopeDefined: new reference (None when there is none).
TL_HIDDEN tl::Ref localScopeDefined(PyObject *Logical);

/// GetParentScopeLogical: borrowed parent-scope record or Py_None.
inline PyObject *parentScopeLogical(LogicalLineObject *L) {
  return L->ParentScope ? L->ParentScope : Py_None;
}

/// Text of the first token after I that is neither a comment nor a line
/// continuation (borrowed), or nullptr when none remains.
TL_HIDDEN PyObject *nextNonRemovedTokenInLogical(LogicalLineObject *L, Py_ssize_t I);
/// The same over a list of token texts.
TL_HIDDEN PyObject *nextNonRemovedTokenInList(PyObject *TokList, Py_ssize_t I);

/// GetNowTime: never raises (an error is reported as unraisable, result 0.0).
TL_HIDDEN double nowTime();

/// Calls ClearLogicalDerivedInfo natively.
inline void clearDerivedInfo(PyObject *Logical) {
  tl::requireStatus(Host.Fast->ClearDerivedInfo(Logical));
}

/// Adds the record and symbol-info functions to the module method table.
TL_HIDDEN extern PyMethodDef RecordFunctions[];
TL_HIDDEN extern PyMethodDef SymbolInfoFunctions[];

/// F(Arg) for a host function; a native one-argument function is called
/// directly, without building an argument tuple. New reference; throws PyErrSet.
inline tl::Ref callOne(PyObject *F, PyObject *Arg) {
  if (PyCFunction_Check(F) && PyCFunction_GET_FLAGS(F) == METH_O)
    return tl::require(PyCFunction_GET_FUNCTION(F)(PyCFunction_GET_SELF(F), Arg));
  return tl::require(PyObject_CallFunctionObjArgs(F, Arg, nullptr));
}

/// Byte of a one-character constant (a byte string or an int); throws otherwise.
TL_HIDDEN char kindByte(PyObject *O, const char *What);

} // namespace host
} // namespace treelens

#endif
