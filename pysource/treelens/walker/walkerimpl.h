// The symbol walker's operations, shared by the driver (walker.cpp) and the handlers (handlers.cpp).
// Every operation throws tl::PyErrSet with a Python error set on failure; node arguments are borrowed
// and type-checked (TypeError "Cannot convert ...") where the operation needs a particular class.
#ifndef TREELENS_WALKER_WALKERIMPL_H
#define TREELENS_WALKER_WALKERIMPL_H

#include "pysource/treelens/nodes/node.h"
#include "pysource/treelens/walker/walker.h"

namespace treelens {
namespace walker {

using NW = NodeWalkerObject;

/// How many leading trailers of one chain (`a.b(c)[d].e`) have their prefixes
/// recorded: the names read (`a.b`) and the calls (`a.b = :r:(c)`). Past it
/// arguments and subscripts are still read, but no prefix is rendered, so a
/// chain of n trailers costs O(n) rather than O(n^2) in time and output. The
/// longest chain of the standard libraries has 11 trailers.
constexpr Py_ssize_t kMaxChainPrefixes = 32;

/// Texts and constants the handlers use, made once at start-up (owned for the process).
struct WalkerConstants {
  PyObject *Empty;                     ///< ""
  PyObject *ListInstance, *DictInstance, *TupleInstance, *StringInstance, *UnicodeInstance;
  PyObject *NoneLiteral, *TrueLiteral, *FalseLiteral; ///< kTypedLiteralPrefix + "None: None" etc.
  PyObject *IntPrefixOnly, *FloatPrefixOnly;          ///< kTypedLiteralPrefix + "int:" / "float:"
  PyObject *KindSet, *KindDict, *KindInt, *KindFloat; ///< "set", "dict", "int", "float"
  PyObject *Isinstance;                               ///< "isinstance"
  PyObject *Colon, *ColonBlank, *Semicolon, *Blank, *Star, *BlankStar, *Return, *Yield, *FromBlank;
  PyObject *MimicName;                                ///< "kMimicAstInspectBugs"
  PyObject *AppendTypeEquiv, *AppendArgName, *AppendArgTypeEquiv, *AppendBaseClassName;
  PyObject *GenExprMessage, *ExceptNameMessage;
};
TL_HIDDEN extern WalkerConstants K;

/// Fills K; called once from initWalkerTypes after the module constants exist.
TL_HIDDEN void initWalkerConstants();

// ---- The driver (walker.cpp) ----
TL_HIDDEN void visitNode(NW *W, PyObject *Node);
TL_HIDDEN void visitChildren(NW *W, PyObject *Node);

// ---- Names, targets and assignments ----
TL_HIDDEN void visitStoreContextNode(NW *W, PyObject *Node, bool WithinSubExpr);
TL_HIDDEN void visitLoadContextNode(NW *W, PyObject *Node);
TL_HIDDEN void visitCompForNode(NW *W, PyObject *Node);
TL_HIDDEN void visitNameLiteral(NW *W, PyObject *Node, PyObject *Atom, PyObject *AllTrailers, Py_ssize_t TrailerI);
TL_HIDDEN void visitDottedName(NW *W, PyObject *Node);
TL_HIDDEN void processLoadName(NW *W, PyObject *Name);
TL_HIDDEN void visitExprStmt(NW *W, PyObject *Node);
TL_HIDDEN void visitAssignment(NW *W, PyObject *Node);
TL_HIDDEN void visitAugAssign(NW *W, PyObject *Node);
TL_HIDDEN void visitAnnotatedAssign(NW *W, PyObject *Node);
TL_HIDDEN void visitForStmt(NW *W, PyObject *Node);
TL_HIDDEN void visitWithItem(NW *W, PyObject *Node);
TL_HIDDEN void visitNamedExpr(NW *W, PyObject *Node);
TL_HIDDEN void visitUsedArgument(NW *W, PyObject *Node);
TL_HIDDEN void processTargets(NW *W, PyObject *Lhs, PyObject *Rhs);
TL_HIDDEN void appendEquivNode(NW *W, PyObject *NameNode, PyObject *EquivNode);
TL_HIDDEN void processNamesFound(NW *W, PyObject *Node);

// ---- Imports ----
TL_HIDDEN void visitImportNames(NW *W, PyObject *Node);
TL_HIDDEN void visitFromImport(NW *W, PyObject *Node);

// ---- Definitions and scopes ----
TL_HIDDEN void visitFuncdef(NW *W, PyObject *Node);
TL_HIDDEN void visitParameters(NW *W, PyObject *Node);
TL_HIDDEN void processDefiningArgList(NW *W, PyObject *ArgList);
TL_HIDDEN void visitLambdaExpr(NW *W, PyObject *Node);
TL_HIDDEN void processLambdaDefiningArgList(NW *W, PyObject *ArgList);
TL_HIDDEN void visitGlobalStmt(NW *W, PyObject *Node);
TL_HIDDEN void visitNonlocalStmt(NW *W, PyObject *Node);
TL_HIDDEN void visitReturn(NW *W, PyObject *Node);
TL_HIDDEN void visitYield(NW *W, PyObject *Node);
TL_HIDDEN void visitSingleDecorator(NW *W, PyObject *Node);
TL_HIDDEN void visitClassdef(NW *W, PyObject *Node);
TL_HIDDEN void visitExceptClause(NW *W, PyObject *Node);
TL_HIDDEN void addNodeInfoStr(NW *W, PyObject *NameNode, PyObject *IStr);

// ---- Case clauses, patterns, type parameters (newsyntax.cpp) ----
TL_HIDDEN void visitCaseBlock(NW *W, PyObject *Node);
TL_HIDDEN void visitPattern(NW *W, PyObject *Node);
TL_HIDDEN void visitTypeParams(NW *W, PyObject *Node);
/// The type parameter list of a def or class node, when it has one.
TL_HIDDEN void visitTypeParamsOf(NW *W, PyObject *Node);
TL_HIDDEN void visitTypeAlias(NW *W, PyObject *Node);

// ---- Calls and type equivalences ----
TL_HIDDEN void visitPower(NW *W, PyObject *Node);
TL_HIDDEN void visitAtomExpr(NW *W, PyObject *Node);
TL_HIDDEN void visitAtomPlusTrailers(NW *W, PyObject *Atom, PyObject *AllTrailers);
TL_HIDDEN void visitCall(NW *W, PyObject *Atom, PyObject *PrevTrailers, PyObject *Arglist);
TL_HIDDEN void processFunctionCall(NW *W, PyObject *FuncName, PyObject *ArgList);
TL_HIDDEN void processIsInstanceCall(NW *W, PyObject *ArgList);
TL_HIDDEN void appendSubscriptedEquivNode(NW *W, PyObject *NameNode, PyObject *EquivNode, Py_ssize_t Subscript);
/// Info byte string or Py_None. New reference.
TL_HIDDEN tl::Ref typeEquivForNode(NW *W, PyObject *Node, PyObject *Extra);

} // namespace walker
} // namespace treelens

#endif
