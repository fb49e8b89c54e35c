// CTypeHintWalker: its construction, dispatch table, fields, pickling and Python surface.
#include "pysource/treelens/hints/hints.h"

#include "fieldpickle.h"
#include "pysource/treelens/hints/hintsimpl.h"
#include "pysource/treelens/nodes/nodehelp.h"
#include "pysource/treelens/nodes/totext.h"
#include "pysource/treelens/walker/methods.h"
#include "typedesc.h"

#include <structmember.h>

namespace treelens {
namespace hints {

using tl::Ref;
using namespace nodehelp;
using C = NodeClass;

namespace {

PyTypeObject TypeHintWalkerType;

/// False while a benchmark times full analysis without the hint walker.
bool AnalyzerWalks = true;

HW *self(PyObject *O) { return reinterpret_cast<HW *>(O); }

/// The type's own method descriptor Name (borrowed).
PyObject *ownMethod(const char *Name) {
  PyObject *M = PyDict_GetItemString(TypeHintWalkerType.tp_dict, Name);
  if (!M)
    tl::raiseFormat(PyExc_ImportError, "CTypeHintWalker.%s is missing", Name);
  return M;
}

int hintWalkerInit(PyObject *Self, PyObject *Args, PyObject *Kwds) {
  return tl::guard<int>(-1, [&] {
    static const char *Keywords[] = {"version_triple", "grammar_file", nullptr};
    PyObject *Version, *Grammar;
    if (!PyArg_ParseTupleAndKeywords(Args, Kwds, "OO:CTypeHintWalker", const_cast<char **>(Keywords), &Version,
                                     &Grammar))
      throw tl::PyErrSet();
    HW *W = self(Self);
    Ref Dict = tl::require(PyDict_New());
    auto Put = [&](C Class, PyObject *Entry) {
      tl::requireStatus(PyDict_SetItem(Dict.get(), reinterpret_cast<PyObject *>(&nodeType(Class)), Entry));
    };
    Put(C::CFuncdefStmt, HK.VisitFuncdef);
    Put(C::CExprStmt, HK.VisitExprStmt);
    Put(C::CForStmt, HK.VisitFor);
    Put(C::CWithStmt, HK.VisitWith);
    Put(C::CNameLiteral, Py_False);
    walker::dispatchWalkerSetUp(&W->Base, Dict.get());
    Ref NameConv = newNodeToTextConverter(false, false, false);
    Ref HintConv = newNodeToTextConverter(/*IncludeBracketText=*/true, /*IncludeStringContents=*/true,
                                          /*IncludeArgText=*/false);
    Ref Parser = tl::require(
        PyObject_CallFunctionObjArgs(reinterpret_cast<PyObject *>(&parserType()), Version, Grammar, nullptr));
    Py_XSETREF(W->NameConv, NameConv.release());
    Py_XSETREF(W->HintConv, HintConv.release());
    W->CommentHintCount = 0;
    Py_XSETREF(W->HintParser, reinterpret_cast<ParserObject *>(Parser.release()));
    return 0;
  });
}

int hintWalkerTraverse(PyObject *Self, visitproc visit, void *arg) {
  if (int R = walker::dispatchWalkerTraverse(Self, visit, arg))
    return R;
  HW *W = self(Self);
  Py_VISIT(W->NameConv);
  Py_VISIT(W->HintConv);
  Py_VISIT(reinterpret_cast<PyObject *>(W->HintParser));
  return 0;
}

int hintWalkerClear(PyObject *Self) {
  walker::dispatchWalkerClear(Self);
  HW *W = self(Self);
  Py_CLEAR(W->NameConv);
  Py_CLEAR(W->HintConv);
  Py_CLEAR(W->HintParser);
  return 0;
}

using OpObject = HW;
Ref done() { return walker::opDone(); }
Ref boolean(bool B) { return Ref::borrow(B ? Py_True : Py_False); }

PyMethodDef HintWalkerMethods[] = {
    TL_OP("Walk", "OO", TL_KEYWORDS("node", "logical"),
          "Walk(node, logical): records the hints of the annotations and type comments of one logical line",
          hintWalk(W, X[0], X[1]);
          return done()),
    TL_NODE_OP("_VisitFuncdefStmt", visitFuncdefStmt,
               "_VisitFuncdefStmt(node): annotations, per-parameter comments and the signature comment of a def"),
    TL_OP("_RewriteFuncdefCommentHint", "O", TL_KEYWORDS("hint"),
          "_RewriteFuncdefCommentHint(hint) -> tokens of a def with the signature comment's types as annotations",
          (void)W;
          return rewriteFuncdefCommentHint(X[0])),
    TL_OP("_ProcessFuncdefComment", "OOO", TL_KEYWORDS("hint", "funcdef_logical", "is_arg"),
          "_ProcessFuncdefComment(hint, funcdef_logical, is_arg): records a signature comment",
          processFuncdefComment(W, X[0], X[1], tl::isTrue(X[2]));
          return done()),
    TL_OP("_ProcessArgSpecificComment", "O", TL_KEYWORDS("arg"),
          "_ProcessArgSpecificComment(arg): records the type comment after one parameter",
          processArgSpecificComment(W, X[0]);
          return done()),
    TL_NODE_OP("_VisitForStmt", visitForStmt, "_VisitForStmt(node): the type comment of a for target"),
    TL_NODE_OP("_VisitWithStmt", visitWithStmt, "_VisitWithStmt(node): the type comment of the with targets"),
    TL_NODE_OP("_VisitExprStmt", visitExprStmt,
               "_VisitExprStmt(node): a variable annotation and the type comment of an assignment"),
    TL_OP("_ProcessTarget", "OO", TL_KEYWORDS("statement", "target"),
          "_ProcessTarget(statement, target): records the hint of the comment ending statement for target",
          processTarget(W, X[0], X[1]);
          return done()),
    TL_OP("_ProcessNameAndHintNodes", "OOO", TL_KEYWORDS("name_node", "hint_node", "is_arg"),
          "_ProcessNameAndHintNodes(name_node, hint_node, is_arg): records a hint, element-wise for sequences",
          processNameAndHintNodes(W, X[0], X[1], tl::isTrue(X[2]));
          return done()),
    TL_OP("_FindEndingTypeComment", "O", TL_KEYWORDS("node"),
          "_FindEndingTypeComment(node) -> hint text of the type comment on the node's last row, or None",
          return findEndingTypeComment(W, X[0])),
    TL_OP("_GetHintFromComment", "O", TL_KEYWORDS("comment"),
          "_GetHintFromComment(comment) -> the hint text of a type comment, or None", (void)W;
          return getHintFromComment(X[0])),
    TL_OP("_GetRowRange", "O", TL_KEYWORDS("node"),
          "_GetRowRange(node) -> (first row, end row) of the node's tokens, the end exclusive",
          auto R = getRowRange(W, X[0]);
          return tl::require(Py_BuildValue("(ll)", R.first, R.second))),
    TL_OP("_IsDottedName", "O", TL_KEYWORDS("text"), "_IsDottedName(text) -> whether text is a dotted name",
          (void)W;
          return boolean(isDottedName(X[0]))),
    TL_OP("_FindComment", "O|O", TL_KEYWORDS("row", "logical"),
          "_FindComment(row, logical=None) -> the first comment token on row, or None",
          return findComment(W, static_cast<long>(indexArg(X[0])), X[1])),
    TL_OP("_GetHintInfoStr", "O", TL_KEYWORDS("node"),
          "_GetHintInfoStr(node) -> the hint info of a return type, or None", return getHintInfoStr(W, X[0])),
    TL_OP("_ParseHint", "O", TL_KEYWORDS("hint"), "_ParseHint(hint) -> the parsed hint's top node, or None",
          return parseHint(W, X[0])),
    TL_OP("_ParseHintTokList", "O", TL_KEYWORDS("tokens"),
          "_ParseHintTokList(tokens) -> the top node of a token list parsed as a hint, or None",
          return parseHintTokList(W, X[0])),
    TL_OP("_AddSymInfo", "OOO", TL_KEYWORDS("name", "istr", "is_arg"),
          "_AddSymInfo(name, istr, is_arg): appends one hint to the walked logical",
          addSymInfo(W, X[0], X[1], tl::isTrue(X[2]));
          return done()),
    {"_SetAnalyzerWalks",
     [](PyObject *, PyObject *Enabled) -> PyObject * {
       return tl::guard<PyObject *>(nullptr, [&] {
         AnalyzerWalks = tl::isTrue(Enabled);
         return done().release();
       });
     },
     METH_O | METH_STATIC,
     "_SetAnalyzerWalks(enabled): whether analyzers run their hint walkers (for benchmarks that time "
     "analysis without them)"},
    {nullptr, nullptr, 0, nullptr}};

#define TL_MEMBER(Name, Type, Field, Doc)                                                                 \
  {const_cast<char *>(Name), Type, offsetof(HW, Field), READONLY, const_cast<char *>(Doc)}

PyMemberDef HintWalkerMembers[] = {
    TL_MEMBER("_fNameConv", T_OBJECT, NameConv, "converter that renders hint targets"),
    TL_MEMBER("_fHintConv", T_OBJECT, HintConv, "converter that renders hint expressions"),
    TL_MEMBER("_fCommentHintCount", T_INT, CommentHintCount, "comments holding 'type:' in the walked line"),
    TL_MEMBER("_fHintParser", T_OBJECT, HintParser, "parser of the hint grammar"),
    {nullptr, 0, 0, 0, nullptr}};

} // namespace

PyTypeObject &typeHintWalkerType() { return TypeHintWalkerType; }

void walk(PyObject *Walker, PyObject *Node, PyObject *Logical) {
  if (!AnalyzerWalks)
    return;
  if (!PyObject_TypeCheck(Walker, &TypeHintWalkerType))
    raiseCannotConvert(Walker, TypeHintWalkerType);
  hintWalk(self(Walker), Node, Logical);
}

int initHintTypes(PyObject *Module) {
  return tl::guard<int>(-1, [&] {
    initHintConstants();
    tl::TypeDesc D;
    D.Name = "pysource.treelens.CTypeHintWalker";
    D.Doc = "CTypeHintWalker(version_triple, grammar_file)\n\n"
            "Records the type hints of annotations and type comments of one logical line.";
    D.Size = sizeof(HW);
    D.Base = &walker::dispatchWalkerType();
    D.Flags = Py_TPFLAGS_DEFAULT | Py_TPFLAGS_HAVE_GC;
    D.Methods = HintWalkerMethods;
    D.Members = HintWalkerMembers;
    D.Dealloc = tl::gcDealloc<hintWalkerClear>;
    D.Traverse = hintWalkerTraverse;
    D.Clear = hintWalkerClear;
    D.Init = hintWalkerInit;
    D.New = PyType_GenericNew;
    tl::requireStatus(tl::readyType(TypeHintWalkerType, D));
    HK.VisitFuncdef = ownMethod("_VisitFuncdefStmt");
    HK.VisitExprStmt = ownMethod("_VisitExprStmt");
    HK.VisitFor = ownMethod("_VisitForStmt");
    HK.VisitWith = ownMethod("_VisitWithStmt");
    tl::requireStatus(tl::addType(Module, "CTypeHintWalker", TypeHintWalkerType));
    using F = tl::FieldKind;
    std::vector<tl::FieldSpec> Fields = walker::dispatchWalkerFields();
    Fields.insert(Fields.end(),
                  {{"_fNameConv", F::Object, offsetof(HW, NameConv), &nodeToTextConverterType()},
                   {"_fHintConv", F::Object, offsetof(HW, HintConv), &nodeToTextConverterType()},
                   {"_fCommentHintCount", F::Int, offsetof(HW, CommentHintCount)},
                   {"_fHintParser", F::Object, offsetof(HW, HintParser), &parserType()}});
    tl::registerPickle(TypeHintWalkerType, std::move(Fields), host::Host.UnpickleFields);
    return 0;
  });
}

} // namespace hints
} // namespace treelens
