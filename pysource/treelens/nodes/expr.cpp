// Expression node accessors: atoms, star, lambda, yield, expression lists, atom_expr, power, number and
// string literals, unary factors, comprehension clauses, 2.7 list displays and trailers.
#include "pysource/treelens/nodes/expr.h"

#include "pysource/treelens/nodes/nodehelp.h"

namespace treelens {

using tl::Ref;
using namespace nodehelp;
using C = NodeClass;

namespace {

/// Interned names of the operations a Python subclass may override, and the
/// token texts passed to _DoesChildTextMatch.
struct ExprNames {
  PyObject *GetInitialBracket, *IsLiteral, *IsComprehension, *IsTwoPlusStringLiterals, *GetStarredExpression,
      *GetValue, *IsYieldFrom, *IsTuple, *IsGenExpr, *GetPrefix, *GetAtom, *GetTrailers, *GetExponentNode,
      *IsFloat, *IsUnicode, *GetStringContents, *GetUnaryOperator, *IsAsync, *GetTargetNode, *GetInNode,
      *GetCompIterNode, *GetDotName, *GetNestedNode, *GetInitialToken;
  PyObject *Comma, *DoubleStar;
};

const ExprNames &names() {
  static const ExprNames Names = {tl::internName("GetInitialBracket"),
                                  tl::internName("IsLiteral"),
                                  tl::internName("IsComprehension"),
                                  tl::internName("IsTwoPlusStringLiterals"),
                                  tl::internName("GetStarredExpression"),
                                  tl::internName("GetValue"),
                                  tl::internName("IsYieldFrom"),
                                  tl::internName("IsTuple"),
                                  tl::internName("IsGenExpr"),
                                  tl::internName("GetPrefix"),
                                  tl::internName("GetAtom"),
                                  tl::internName("GetTrailers"),
                                  tl::internName("GetExponentNode"),
                                  tl::internName("IsFloat"),
                                  tl::internName("IsUnicode"),
                                  tl::internName("GetStringContents"),
                                  tl::internName("GetUnaryOperator"),
                                  tl::internName("IsAsync"),
                                  tl::internName("GetTargetNode"),
                                  tl::internName("GetInNode"),
                                  tl::internName("GetCompIterNode"),
                                  tl::internName("GetDotName"),
                                  tl::internName("GetNestedNode"),
                                  tl::internName("GetInitialToken"),
                                  tl::internName(","),
                                  tl::internName("**")};
  return Names;
}

const AtomOps TheAtomOps;
const StarExpressionOps TheStarOps;
const LambdaOps TheLambdaOps;
const YieldExprOps TheYieldExprOps;
const TestListStarExprOps TheTestListOps;
const AtomExprOps TheAtomExprOps;
const PowerOps ThePowerOps;
const NumberLiteralOps TheNumberOps;
const StringLiteralOps TheStringOps;
const FactorOps TheFactorOps;
const YieldArgOps TheYieldArgOps;
const CompForOps TheCompForOps;
const ListmakerOps TheListmakerOps;
const TrailerOps TheTrailerOps;

/// The Python override of Name on N, if N's class defines one.
inline PyObject *overridden(NodeObject *N, PyObject *Name) { return tl::pythonOverride(obj(N), Name); }

/// A node-valued result from an override or a slot, kept alive until the
/// next delegation so that the slots of ExpressionOps can return it
/// borrowed; their callers take their own reference at once.
PyObject *keepBorrowed(Ref R) {
  static PyObject *Kept = nullptr;
  Py_XSETREF(Kept, R.release());
  return Kept;
}

/// Bytes object of the slice [Begin, End) of Text (empty when End <= Begin).
Ref byteSlice(PyObject *Text, Py_ssize_t Begin, Py_ssize_t End) {
  if (End < Begin)
    End = Begin;
  return tl::require(PyString_FromStringAndSize(PyString_AS_STRING(Text) + Begin, End - Begin));
}

/// A leaf's text as a byte string; TypeError when the node has none.
PyObject *leafText(NodeObject *N, const char *Op) {
  if (!N->Text)
    tl::raiseFormat(PyExc_TypeError, "%.100s of a node without text", Op);
  if (!PyString_Check(N->Text))
    tl::expectType(false, "bytes", N->Text);
  return N->Text;
}

} // namespace

// ---- CAtom ----

// atom: '(' [yield_expr|testlist_comp] ')' | '[' [listmaker|testlist_comp] ']' |
//       '{' [dictorsetmaker] '}' | '`' testlist1 '`' | NAME | NUMBER | STRING+ | ...
Ref AtomOps::getInitialBracket(NodeObject *N) const {
  if (nodeGetChildCount(N) == 0)
    tl::raise(PyExc_ValueError, "Atom node with no children");
  PyObject *T = childAt(N, 0)->Text;
  if (textIs(T, "[") || textIs(T, "{") || textIs(T, "("))
    return Ref::borrow(T);
  return none();
}

bool AtomOps::isComprehension(NodeObject *N) const {
  if (nodeGetChildCount(N) != 3)
    return false;
  NodeObject *Inner = childAt(N, 1);
  Py_ssize_t Count = nodeGetChildCount(Inner);
  if (Count == 0)
    return false;
  if (Count > 1 && isNodeOf(obj(childAt(Inner, 1)), C::CCompForNode))
    return true;
  return Count > 3 && isNodeOf(obj(childAt(Inner, 3)), C::CCompForNode);
}

bool AtomOps::isLiteral(NodeObject *N) const {
  return neverRaises("pysource.treelens.CAtom.IsLiteral", false, [&] { return !atomIsComprehension(N); });
}

bool AtomOps::isTwoPlusStringLiterals(NodeObject *N) const {
  return neverRaises("pysource.treelens.CAtom.IsTwoPlusStringLiterals", false, [&] {
    Py_ssize_t Count = rawCount(N);
    if (Count < 2)
      return false;
    for (Py_ssize_t K = 0; K < Count; ++K)
      if (!isNodeOf(PyList_GET_ITEM(N->Children, K), C::CStringLiteral))
        return false;
    return true;
  });
}

Py_ssize_t AtomOps::getSubExprCount(NodeObject *N) const {
  return neverRaises<Py_ssize_t>("pysource.treelens.CAtom.GetSubExprCount", 0, [&]() -> Py_ssize_t {
    if (nodeGetChildCount(N) != 3)
      return 0;
    Ref Bracket = atomGetInitialBracket(N);
    bool Square = textIs(Bracket.get(), "[");
    if (!Square && !textIs(Bracket.get(), "("))
      return 0;
    if (!atomIsLiteral(N))
      return 0;
    NodeObject *Inner = childAt(N, 1);
    if (isNodeOf(obj(Inner), C::CExpression)) {
      Py_ssize_t Count = exprGetSubExprCount(Inner);
      if (Count != 0)
        return Count;
      return Square ? 1 : 0;
    }
    if (isNodeOf(obj(Inner), C::CListmakerNode))
      return listmakerGetSubExprCount(Inner);
    return 0;
  });
}

PyObject *AtomOps::getSubExpr(NodeObject *N, Py_ssize_t I) const {
  return tl::guard<PyObject *>(nullptr, [&]() -> PyObject * {
    if (exprGetSubExprCount(N) == 0)
      return Py_None;
    NodeObject *Inner = childAt(N, 1);
    if (isNodeOf(obj(Inner), C::CExpression)) {
      if (I == 0 && exprGetSubExprCount(Inner) <= 0)
        return obj(Inner);
      return keepBorrowed(exprGetSubExpr(Inner, I));
    }
    if (isNodeOf(obj(Inner), C::CListmakerNode))
      return keepBorrowed(listmakerGetSubExpr(Inner, I));
    return Py_None;
  });
}

// ---- CStarExpression, CLambdaExpr ----

// star_expr: '*' expr
Ref StarExpressionOps::getStarredExpression(NodeObject *N) const { return ref(childAt(N, 1)); }

// lambdef: 'lambda' [varargslist] ':' test
Ref LambdaOps::getArgumentsNode(NodeObject *N) const {
  if (childTextIs(N, 1, ":"))
    return none();
  return ref(childAt(N, 1));
}

Ref LambdaOps::getBodyExpr(NodeObject *N) const { return ref(childAt(N, -1)); }

// ---- CYieldExpr, CYieldArg ----

// yield_expr: 'yield' [yield_arg]
Ref YieldExprOps::getValue(NodeObject *N) const {
  if (nodeGetChildCount(N) < 2)
    return none();
  NodeObject *Arg = childAt(N, 1);
  if (isNodeOf(obj(Arg), C::CYieldArg))
    return yieldArgGetValue(Arg);
  return ref(Arg);
}

bool YieldExprOps::isYieldFrom(NodeObject *N) const {
  return neverRaises("pysource.treelens.CYieldExpr.IsYieldFrom", false, [&] {
    if (nodeGetChildCount(N) < 2)
      return false;
    NodeObject *Arg = childAt(N, 1);
    return isNodeOf(obj(Arg), C::CYieldArg) && yieldArgIsYieldFrom(Arg);
  });
}

// yield_arg: 'from' test | testlist
Ref YieldArgOps::getValue(NodeObject *N) const { return ref(childAt(N, nodeGetChildCount(N) >= 2 ? 1 : 0)); }

bool YieldArgOps::isYieldFrom(NodeObject *N) const {
  return neverRaises("pysource.treelens.CYieldArg.IsYieldFrom", false, [&] {
    if (nodeGetChildCount(N) < 2)
      return false;
    NodeObject *First = childAt(N, 0);
    return isNodeOf(obj(First), C::CKeywordLiteral) && leafIs(First, "from");
  });
}

// ---- CTestListStarExpr ----

// testlist_comp: test ( comp_for | (',' test)* [','] ), and the plain lists
// exprlist, testlist, testlist_star_expr.
bool TestListStarExprOps::isGenExpr(NodeObject *N) const {
  return neverRaises("pysource.treelens.CTestListStarExpr.IsGenExpr", false, [&] {
    return nodeGetChildCount(N) >= 2 && isNodeOf(obj(childAt(N, 1)), C::CCompForNode);
  });
}

bool TestListStarExprOps::isTuple(NodeObject *N) const {
  return neverRaises("pysource.treelens.CTestListStarExpr.IsTuple", false,
                     [&] { return !testListIsGenExpr(N) && nodeDoesChildTextMatch(N, names().Comma); });
}

Py_ssize_t TestListStarExprOps::getSubExprCount(NodeObject *N) const {
  return neverRaises<Py_ssize_t>("pysource.treelens.CTestListStarExpr.GetSubExprCount", 0,
                                 [&]() -> Py_ssize_t {
                                   if (testListIsGenExpr(N))
                                     return 0;
                                   return plus(nodeGetChildCount(N), 1) / 2;
                                 });
}

PyObject *TestListStarExprOps::getSubExpr(NodeObject *N, Py_ssize_t I) const {
  return tl::guard<PyObject *>(nullptr, [&]() -> PyObject * {
    if (testListIsGenExpr(N))
      return Py_None;
    Py_ssize_t J = twice(I);
    if (J >= nodeGetChildCount(N))
      tl::raise(PyExc_ValueError, "Not enough expressions in list");
    NodeObject *Item = childAt(N, J);
    // The 3.x Ellipsis token is a plain leaf, not an expression node: an
    // element with no expression to give.
    if (leafIs(Item, "..."))
      return Py_None;
    if (!isNodeOf(obj(Item), C::CExpression)) {
      Ref NodeRepr = tl::require(PyObject_Repr(obj(N)));
      Ref ChildrenRepr = tl::require(PyObject_Repr(N->Children));
      tl::raiseFormat(PyExc_ValueError, "Elenment %zd of %s needs to be a CExpression; fChildren = %s", J,
                      PyString_AS_STRING(NodeRepr.get()), PyString_AS_STRING(ChildrenRepr.get()));
    }
    return obj(Item);
  });
}

// ---- CAtomExpr, CPower ----

// atom_expr: [AWAIT] atom trailer*
Ref AtomExprOps::getPrefix(NodeObject *N) const {
  if (nodeGetChildCount(N) < 2)
    return none();
  NodeObject *First = childAt(N, 0);
  if (isNodeOf(obj(First), C::CKeywordLiteral) && leafIs(First, "await") &&
      !isNodeOf(obj(childAt(N, 1)), C::CTrailer))
    return ref(First);
  return none();
}

Ref AtomExprOps::getAtom(NodeObject *N) const {
  Ref Prefix = atomExprGetPrefix(N);
  return ref(childAt(N, Prefix.get() == Py_None ? 0 : 1));
}

Ref AtomExprOps::getTrailers(NodeObject *N) const {
  Ref Prefix = atomExprGetPrefix(N);
  if (!N->Children)
    tl::raise(PyExc_TypeError, "'NoneType' object has no attribute '__getitem__'");
  Py_ssize_t Start = Prefix.get() == Py_None ? 1 : 2;
  return tl::require(PyList_GetSlice(N->Children, Start, PyList_GET_SIZE(N->Children)));
}

// power: atom trailer* ['**' factor] (2.7) | atom_expr ['**' factor] (3.x)
Ref PowerOps::getAtom(NodeObject *N) const {
  NodeObject *First = childAt(N, 0);
  if (isNodeOf(obj(First), C::CAtomExpr))
    return atomExprGetAtom(First);
  return ref(First);
}

Ref PowerOps::getTrailers(NodeObject *N) const {
  NodeObject *First = childAt(N, 0);
  if (isNodeOf(obj(First), C::CAtomExpr))
    return atomExprGetTrailers(First);
  Py_ssize_t End = 1;
  for (; End < PyList_GET_SIZE(N->Children); ++End)
    if (leafIs(childAt(N, End), "**"))
      break;
  return tl::require(PyList_GetSlice(N->Children, 1, End));
}

Ref PowerOps::getExponentNode(NodeObject *N) const {
  if (!nodeDoesChildTextMatch(N, names().DoubleStar))
    return none();
  return ref(childAt(N, -1));
}

// ---- Literals and unary factors ----

// A float has a '.' or an exponent; the digits e and E of a hexadecimal
// literal (0x1e) are no exponent.
bool NumberLiteralOps::isFloat(NodeObject *N) const {
  return neverRaises("pysource.treelens.CNumberLiteral.IsFloat", false, [&] {
    if (!N->Text)
      tl::raise(PyExc_TypeError, "argument of type 'NoneType' is not iterable");
    PyObject *T = leafText(N, "IsFloat");
    const char *S = PyString_AS_STRING(T);
    if (PyString_GET_SIZE(T) >= 2 && S[0] == '0' && (S[1] == 'x' || S[1] == 'X'))
      return false;
    for (Py_ssize_t K = 0; K < PyString_GET_SIZE(T); ++K)
      if (S[K] == '.' || S[K] == 'e' || S[K] == 'E')
        return true;
    return false;
  });
}

bool StringLiteralOps::isUnicode(NodeObject *N) const {
  return neverRaises("pysource.treelens.CStringLiteral.IsUnicode", false, [&] {
    if (!N->Text)
      tl::raise(PyExc_TypeError, "object of type 'NoneType' has no len()");
    PyObject *T = leafText(N, "IsUnicode");
    Py_ssize_t Size = PyString_GET_SIZE(T);
    if (Size == 0)
      return false;
    const char *S = PyString_AS_STRING(T);
    char Ch = S[0];
    if ((Ch == 'r' || Ch == 'R') && Size > 1)
      Ch = S[1];
    return Ch == 'u' || Ch == 'U';
  });
}

// STRING: [prefix letters] quote body quote, the closing quote missing while typing.
Ref StringLiteralOps::getStringContents(NodeObject *N) const {
  if (!N->Text)
    tl::raise(PyExc_TypeError, "object of type 'NoneType' has no len()");
  PyObject *T = leafText(N, "GetStringContents");
  const char *S = PyString_AS_STRING(T);
  Py_ssize_t Size = PyString_GET_SIZE(T);
  Py_ssize_t I = 0;
  while (I < Size && S[I] && std::strchr("uUbBrRfF", S[I]))
    ++I;
  if (I >= Size || (S[I] != '"' && S[I] != '\''))
    return byteSlice(T, 0, 0);
  char Quote = S[I];
  Py_ssize_t QuoteLen = 1;
  if (I + 1 < Size && S[I + 1] == Quote) {
    if (I + 2 < Size && S[I + 2] == Quote)
      QuoteLen = 3;
    else
      return byteSlice(T, 0, 0);
  }
  bool Closed = Size >= QuoteLen;
  for (Py_ssize_t K = 0; Closed && K < QuoteLen; ++K)
    Closed = S[Size - 1 - K] == Quote;
  if (Closed)
    return byteSlice(T, I + QuoteLen, Size - QuoteLen);
  return byteSlice(T, I + QuoteLen, Size);
}

// factor: ('+'|'-'|'~') factor
Ref FactorOps::getUnaryOperator(NodeObject *N) const {
  Ref Op = nodeGetChildText(N, 0);
  if (textIs(Op.get(), "+") || textIs(Op.get(), "-") || textIs(Op.get(), "~"))
    return Op;
  return none();
}

// ---- CCompForNode, CListmakerNode ----

// comp_for: [ASYNC] 'for' exprlist 'in' or_test [comp_iter]
// list_for: 'for' exprlist 'in' testlist_safe [list_iter]
bool CompForOps::isAsync(NodeObject *N) const {
  return neverRaises("pysource.treelens.CCompForNode.IsAsync", false,
                     [&] { return childTextIs(N, 0, "async"); });
}

Ref CompForOps::getTargetNode(NodeObject *N) const { return ref(childAt(N, 1 + compForIsAsync(N))); }

Ref CompForOps::getInNode(NodeObject *N) const { return ref(childAt(N, 3 + compForIsAsync(N))); }

Ref CompForOps::getCompIterNode(NodeObject *N) const {
  Py_ssize_t A = compForIsAsync(N);
  if (nodeGetChildCount(N) != 5 + A)
    return none();
  return ref(childAt(N, 4 + A));
}

// listmaker: test ( list_for | (',' test)* [','] )
Py_ssize_t ListmakerOps::getSubExprCount(NodeObject *N) const {
  return neverRaises<Py_ssize_t>("pysource.treelens.CListmakerNode.GetSubExprCount", 0, [&]() -> Py_ssize_t {
    if (isNodeOf(obj(childAt(N, 1)), C::CCompForNode))
      return 0;
    // An override may give any count: no overflow below.
    Py_ssize_t Count = nodeGetChildCount(N);
    return (Count == PY_SSIZE_T_MIN ? Count / 2 : (Count - 1) / 2) + 1;
  });
}

Ref ListmakerOps::getSubExpr(NodeObject *N, Py_ssize_t I) const {
  if (isNodeOf(obj(childAt(N, 1)), C::CCompForNode))
    return none();
  Ref Item = nodeGetChild(N, twice(I));
  if (Item.get() != Py_None && !isNodeOf(Item.get(), C::CExpression))
    raiseCannotConvert(Item.get(), nodeType(C::CExpression));
  return Item;
}

// ---- CTrailer ----

// trailer: '(' [arglist] ')' | '[' subscriptlist ']' | '.' NAME
Ref TrailerOps::getDotName(NodeObject *N) const {
  if (nodeGetChildCount(N) != 2 || !leafIs(childAt(N, 0), "."))
    return none();
  NodeObject *Name = childAt(N, 1);
  if (!isNodeOf(obj(Name), C::CNameLiteral))
    return none();
  return Ref::borrow(Name->Text ? Name->Text : Py_None);
}

Ref TrailerOps::getNestedNode(NodeObject *N) const {
  if (nodeGetChildCount(N) != 3)
    return none();
  Ref Open = nodeGetChildText(N, 0);
  if (!textIs(Open.get(), "[") && !textIs(Open.get(), "("))
    return none();
  return ref(childAt(N, 1));
}

Ref TrailerOps::getInitialToken(NodeObject *N) const {
  if (nodeGetChildCount(N) == 0)
    tl::raise(PyExc_ValueError, "Trailer node with no children");
  PyObject *T = childAt(N, 0)->Text;
  return Ref::borrow(T ? T : Py_None);
}

// ---- Native callers ----

namespace {

/// Calls the override of Name when N's class has one, else Native().
template <class F> Ref dispatchRef(NodeObject *N, PyObject *Name, F &&Native) {
  if (overridden(N, Name))
    return tl::callMethod(obj(N), Name);
  return Native();
}

/// The same for a boolean operation that never raises.
template <class F> bool dispatchBool(const char *Where, NodeObject *N, PyObject *Name, F &&Native) {
  if (!overridden(N, Name))
    return Native();
  return neverRaises(Where, false, [&] { return truth(tl::callMethod(obj(N), Name)); });
}

} // namespace

#define TL_REF_CALLER(Fn, OpsT, Cls, Name, Slot)                                                             \
  Ref Fn(NodeObject *N) {                                                                                    \
    const OpsT *O = opsAs<OpsT>(N, C::Cls);                                                                  \
    return dispatchRef(N, names().Name, [&] { return O->Slot(N); });                                         \
  }

#define TL_BOOL_CALLER(Fn, OpsT, Cls, Name, Slot)                                                            \
  bool Fn(NodeObject *N) {                                                                                   \
    const OpsT *O = nullptr;                                                                                 \
    if (!neverRaises("pysource.treelens." #Cls "." #Name, false, [&] {                                       \
          O = opsAs<OpsT>(N, C::Cls);                                                                        \
          return true;                                                                                       \
        }))                                                                                                  \
      return false;                                                                                          \
    return dispatchBool("pysource.treelens." #Cls "." #Name, N, names().Name, [&] { return O->Slot(N); });   \
  }

TL_REF_CALLER(atomGetInitialBracket, AtomOps, CAtom, GetInitialBracket, getInitialBracket)
TL_BOOL_CALLER(atomIsLiteral, AtomOps, CAtom, IsLiteral, isLiteral)
TL_BOOL_CALLER(atomIsTwoPlusStringLiterals, AtomOps, CAtom, IsTwoPlusStringLiterals, isTwoPlusStringLiterals)
TL_REF_CALLER(starGetStarredExpression, StarExpressionOps, CStarExpression, GetStarredExpression,
              getStarredExpression)
TL_REF_CALLER(yieldExprGetValue, YieldExprOps, CYieldExpr, GetValue, getValue)
TL_BOOL_CALLER(yieldExprIsYieldFrom, YieldExprOps, CYieldExpr, IsYieldFrom, isYieldFrom)
TL_REF_CALLER(yieldArgGetValue, YieldArgOps, CYieldArg, GetValue, getValue)
TL_BOOL_CALLER(yieldArgIsYieldFrom, YieldArgOps, CYieldArg, IsYieldFrom, isYieldFrom)
TL_BOOL_CALLER(testListIsTuple, TestListStarExprOps, CTestListStarExpr, IsTuple, isTuple)
TL_BOOL_CALLER(testListIsGenExpr, TestListStarExprOps, CTestListStarExpr, IsGenExpr, isGenExpr)
TL_REF_CALLER(atomExprGetPrefix, AtomExprOps, CAtomExpr, GetPrefix, getPrefix)
TL_REF_CALLER(atomExprGetAtom, AtomExprOps, CAtomExpr, GetAtom, getAtom)
TL_REF_CALLER(atomExprGetTrailers, AtomExprOps, CAtomExpr, GetTrailers, getTrailers)
TL_REF_CALLER(powerGetAtom, PowerOps, CPower, GetAtom, getAtom)
TL_REF_CALLER(powerGetTrailers, PowerOps, CPower, GetTrailers, getTrailers)
TL_REF_CALLER(powerGetExponentNode, PowerOps, CPower, GetExponentNode, getExponentNode)
TL_BOOL_CALLER(numberIsFloat, NumberLiteralOps, CNumberLiteral, IsFloat, isFloat)
TL_BOOL_CALLER(stringIsUnicode, StringLiteralOps, CStringLiteral, IsUnicode, isUnicode)
TL_REF_CALLER(stringGetStringContents, StringLiteralOps, CStringLiteral, GetStringContents, getStringContents)
TL_REF_CALLER(factorGetUnaryOperator, FactorOps, CFactorExpr, GetUnaryOperator, getUnaryOperator)
TL_BOOL_CALLER(compForIsAsync, CompForOps, CCompForNode, IsAsync, isAsync)
TL_REF_CALLER(compForGetTargetNode, CompForOps, CCompForNode, GetTargetNode, getTargetNode)
TL_REF_CALLER(compForGetInNode, CompForOps, CCompForNode, GetInNode, getInNode)
TL_REF_CALLER(compForGetCompIterNode, CompForOps, CCompForNode, GetCompIterNode, getCompIterNode)
TL_REF_CALLER(trailerGetDotName, TrailerOps, CTrailer, GetDotName, getDotName)
TL_REF_CALLER(trailerGetNestedNode, TrailerOps, CTrailer, GetNestedNode, getNestedNode)
TL_REF_CALLER(trailerGetInitialToken, TrailerOps, CTrailer, GetInitialToken, getInitialToken)

#undef TL_REF_CALLER
#undef TL_BOOL_CALLER

bool atomIsComprehension(NodeObject *N) {
  const AtomOps *O = opsAs<AtomOps>(N, C::CAtom);
  if (overridden(N, names().IsComprehension))
    return truth(tl::callMethod(obj(N), names().IsComprehension));
  return O->isComprehension(N);
}

Ref lambdaGetArgumentsNode(NodeObject *N) { return opsAs<LambdaOps>(N, C::CLambdaExpr)->getArgumentsNode(N); }

Ref lambdaGetBodyExpr(NodeObject *N) { return opsAs<LambdaOps>(N, C::CLambdaExpr)->getBodyExpr(N); }

Py_ssize_t listmakerGetSubExprCount(NodeObject *N) {
  return neverRaises<Py_ssize_t>("pysource.treelens.CListmakerNode.GetSubExprCount", 0, [&] {
    const ListmakerOps *O = opsAs<ListmakerOps>(N, C::CListmakerNode);
    if (overridden(N, NodeNames.GetSubExprCount))
      return sizeOf(tl::callMethod(obj(N), NodeNames.GetSubExprCount));
    return O->getSubExprCount(N);
  });
}

Ref listmakerGetSubExpr(NodeObject *N, Py_ssize_t I) {
  const ListmakerOps *O = opsAs<ListmakerOps>(N, C::CListmakerNode);
  if (overridden(N, NodeNames.GetSubExpr)) {
    Ref Index = tl::require(PyInt_FromSsize_t(I));
    return tl::callMethod(obj(N), NodeNames.GetSubExpr, Index.get());
  }
  return O->getSubExpr(N, I);
}

// ---- Python surface ----

namespace {

/// A Python method running the defining class's own slot (not a subclass's).
#define TL_PY_REF(Fn, Ops, OpsT, Slot)                                                                       \
  PyObject *Fn(PyObject *Self, PyObject *) {                                                                 \
    return tl::guard<PyObject *>(nullptr, [&] { return Ops.OpsT::Slot(node(Self)).release(); });             \
  }
#define TL_PY_BOOL(Fn, Ops, OpsT, Slot)                                                                      \
  PyObject *Fn(PyObject *Self, PyObject *) { return pyBool(Ops.OpsT::Slot(node(Self))); }

PyObject *pySubExprCount(Py_ssize_t Count) { return PyInt_FromSsize_t(Count); }

TL_PY_REF(atom_GetInitialBracket, TheAtomOps, AtomOps, getInitialBracket)
TL_PY_BOOL(atom_IsLiteral, TheAtomOps, AtomOps, isLiteral)
TL_PY_BOOL(atom_IsTwoPlusStringLiterals, TheAtomOps, AtomOps, isTwoPlusStringLiterals)

PyObject *atom_IsComprehension(PyObject *Self, PyObject *) {
  return tl::guard<PyObject *>(nullptr,
                               [&] { return pyBool(TheAtomOps.AtomOps::isComprehension(node(Self))); });
}

PyObject *atom_GetSubExprCount(PyObject *Self, PyObject *) {
  return pySubExprCount(TheAtomOps.AtomOps::getSubExprCount(node(Self)));
}

PyObject *atom_GetSubExpr(PyObject *Self, PyObject *Arg) {
  return tl::guard<PyObject *>(nullptr, [&] {
    PyObject *R = TheAtomOps.AtomOps::getSubExpr(node(Self), indexArg(Arg));
    if (!R)
      throw tl::PyErrSet();
    Py_INCREF(R);
    return R;
  });
}

TL_PY_REF(star_GetStarredExpression, TheStarOps, StarExpressionOps, getStarredExpression)
TL_PY_REF(yield_GetValue, TheYieldExprOps, YieldExprOps, getValue)
TL_PY_BOOL(yield_IsYieldFrom, TheYieldExprOps, YieldExprOps, isYieldFrom)
TL_PY_REF(yieldarg_GetValue, TheYieldArgOps, YieldArgOps, getValue)
TL_PY_BOOL(yieldarg_IsYieldFrom, TheYieldArgOps, YieldArgOps, isYieldFrom)
TL_PY_BOOL(testlist_IsTuple, TheTestListOps, TestListStarExprOps, isTuple)
TL_PY_BOOL(testlist_IsGenExpr, TheTestListOps, TestListStarExprOps, isGenExpr)

PyObject *testlist_GetSubExprCount(PyObject *Self, PyObject *) {
  return pySubExprCount(TheTestListOps.TestListStarExprOps::getSubExprCount(node(Self)));
}

PyObject *testlist_GetSubExpr(PyObject *Self, PyObject *Arg) {
  return tl::guard<PyObject *>(nullptr, [&] {
    PyObject *R = TheTestListOps.TestListStarExprOps::getSubExpr(node(Self), indexArg(Arg));
    if (!R)
      throw tl::PyErrSet();
    Py_INCREF(R);
    return R;
  });
}

TL_PY_REF(atomexpr_GetPrefix, TheAtomExprOps, AtomExprOps, getPrefix)
TL_PY_REF(atomexpr_GetAtom, TheAtomExprOps, AtomExprOps, getAtom)
TL_PY_REF(atomexpr_GetTrailers, TheAtomExprOps, AtomExprOps, getTrailers)
TL_PY_REF(power_GetAtom, ThePowerOps, PowerOps, getAtom)
TL_PY_REF(power_GetTrailers, ThePowerOps, PowerOps, getTrailers)
TL_PY_REF(power_GetExponentNode, ThePowerOps, PowerOps, getExponentNode)
TL_PY_BOOL(number_IsFloat, TheNumberOps, NumberLiteralOps, isFloat)
TL_PY_BOOL(string_IsUnicode, TheStringOps, StringLiteralOps, isUnicode)
TL_PY_REF(string_GetStringContents, TheStringOps, StringLiteralOps, getStringContents)
TL_PY_REF(factor_GetUnaryOperator, TheFactorOps, FactorOps, getUnaryOperator)
TL_PY_BOOL(compfor_IsAsync, TheCompForOps, CompForOps, isAsync)
TL_PY_REF(compfor_GetTargetNode, TheCompForOps, CompForOps, getTargetNode)
TL_PY_REF(compfor_GetInNode, TheCompForOps, CompForOps, getInNode)
TL_PY_REF(compfor_GetCompIterNode, TheCompForOps, CompForOps, getCompIterNode)
TL_PY_REF(trailer_GetDotName, TheTrailerOps, TrailerOps, getDotName)
TL_PY_REF(trailer_GetNestedNode, TheTrailerOps, TrailerOps, getNestedNode)
TL_PY_REF(trailer_GetInitialToken, TheTrailerOps, TrailerOps, getInitialToken)

PyObject *listmaker_GetSubExprCount(PyObject *Self, PyObject *) {
  return pySubExprCount(TheListmakerOps.ListmakerOps::getSubExprCount(node(Self)));
}

PyObject *listmaker_GetSubExpr(PyObject *Self, PyObject *Arg) {
  return tl::guard<PyObject *>(
      nullptr, [&] { return TheListmakerOps.ListmakerOps::getSubExpr(node(Self), indexArg(Arg)).release(); });
}

#undef TL_PY_REF
#undef TL_PY_BOOL

#define TL_NOARGS(Name, Fn, Doc)                                                                             \
  { Name, Fn, METH_NOARGS, Doc }
#define TL_END                                                                                               \
  { nullptr, nullptr, 0, nullptr }

PyMethodDef AtomMethods[] = {
    {"GetSubExpr", atom_GetSubExpr, METH_O,
     "GetSubExpr(i) -> CExpression or None: element i of a tuple or list display"},
    TL_NOARGS("GetSubExprCount", atom_GetSubExprCount,
              "GetSubExprCount() -> int: elements of a tuple or list display; 0 for (x), braces and "
              "comprehensions"),
    TL_NOARGS("GetInitialBracket", atom_GetInitialBracket, "GetInitialBracket() -> '(', '[', '{' or None"),
    TL_NOARGS("IsLiteral", atom_IsLiteral, "IsLiteral() -> bool: not a comprehension"),
    TL_NOARGS("IsComprehension", atom_IsComprehension,
              "IsComprehension() -> bool: a list, set, dict or generator comprehension"),
    TL_NOARGS("IsTwoPlusStringLiterals", atom_IsTwoPlusStringLiterals,
              "IsTwoPlusStringLiterals() -> bool: a run of two or more adjacent string literals"),
    TL_END};

PyMethodDef StarMethods[] = {TL_NOARGS("GetStarredExpression", star_GetStarredExpression,
                                       "GetStarredExpression() -> CExpression: the expression after '*'"),
                             TL_END};

PyMethodDef YieldExprMethods[] = {
    TL_NOARGS("GetValue", yield_GetValue, "GetValue() -> node or None: the yielded value"),
    TL_NOARGS("IsYieldFrom", yield_IsYieldFrom, "IsYieldFrom() -> bool: a 'yield from'"), TL_END};

PyMethodDef YieldArgMethods[] = {
    TL_NOARGS("GetValue", yieldarg_GetValue, "GetValue() -> node: the yielded value"),
    TL_NOARGS("IsYieldFrom", yieldarg_IsYieldFrom, "IsYieldFrom() -> bool: starts with 'from'"), TL_END};

PyMethodDef TestListMethods[] = {
    {"GetSubExpr", testlist_GetSubExpr, METH_O,
     "GetSubExpr(i) -> CExpression or None: element i of the list (None for a generator)"},
    TL_NOARGS("GetSubExprCount", testlist_GetSubExprCount,
              "GetSubExprCount() -> int: number of elements, 0 for a generator"),
    TL_NOARGS("IsTuple", testlist_IsTuple, "IsTuple() -> bool: has a comma and is not a generator"),
    TL_NOARGS("IsGenExpr", testlist_IsGenExpr,
              "IsGenExpr() -> bool: an expression followed by a comprehension clause"),
    TL_END};

PyMethodDef AtomExprMethods[] = {
    TL_NOARGS("GetPrefix", atomexpr_GetPrefix, "GetPrefix() -> the 'await' keyword node or None"),
    TL_NOARGS("GetAtom", atomexpr_GetAtom, "GetAtom() -> node: the atom after the prefix"),
    TL_NOARGS("GetTrailers", atomexpr_GetTrailers, "GetTrailers() -> new list of the trailer nodes"), TL_END};

PyMethodDef PowerMethods[] = {
    TL_NOARGS("GetAtom", power_GetAtom, "GetAtom() -> node: the atom"),
    TL_NOARGS("GetTrailers", power_GetTrailers, "GetTrailers() -> new list of the trailers before '**'"),
    TL_NOARGS("GetExponentNode", power_GetExponentNode, "GetExponentNode() -> node after '**', or None"),
    TL_END};

PyMethodDef NumberMethods[] = {
    TL_NOARGS("IsFloat", number_IsFloat, "IsFloat() -> bool: the text contains '.', 'e' or 'E'"), TL_END};

PyMethodDef StringMethods[] = {
    TL_NOARGS("IsUnicode", string_IsUnicode, "IsUnicode() -> bool: has a u prefix (after an optional r)"),
    TL_NOARGS("GetStringContents", string_GetStringContents,
              "GetStringContents() -> bytes: the text between the quotes"),
    TL_END};

PyMethodDef FactorMethods[] = {
    TL_NOARGS("GetUnaryOperator", factor_GetUnaryOperator, "GetUnaryOperator() -> '+', '-', '~' or None"),
    TL_END};

PyMethodDef CompForMethods[] = {
    TL_NOARGS("IsAsync", compfor_IsAsync, "IsAsync() -> bool: the clause starts with 'async'"),
    TL_NOARGS("GetTargetNode", compfor_GetTargetNode, "GetTargetNode() -> node: the targets after 'for'"),
    TL_NOARGS("GetInNode", compfor_GetInNode, "GetInNode() -> node: the iterable after 'in'"),
    TL_NOARGS("GetCompIterNode", compfor_GetCompIterNode,
              "GetCompIterNode() -> node or None: the next 'for' or 'if' clause"),
    TL_END};

PyMethodDef ListmakerMethods[] = {
    TL_NOARGS("GetSubExprCount", listmaker_GetSubExprCount,
              "GetSubExprCount() -> int: number of elements, 0 for a list comprehension"),
    {"GetSubExpr", listmaker_GetSubExpr, METH_O,
     "GetSubExpr(i) -> CExpression or None: element i (None past the end or for a comprehension)"},
    TL_END};

PyMethodDef TrailerMethods[] = {
    TL_NOARGS("GetDotName", trailer_GetDotName, "GetDotName() -> bytes or None: the name of '.' NAME"),
    TL_NOARGS("GetNestedNode", trailer_GetNestedNode,
              "GetNestedNode() -> node or None: the node inside '(' ')' or '[' ']'"),
    TL_NOARGS("GetInitialToken", trailer_GetInitialToken, "GetInitialToken() -> '(', '[' or '.'"), TL_END};

#undef TL_NOARGS
#undef TL_END

} // namespace

const NodeOps *exprClassOps(NodeClass Cls) {
  switch (Cls) {
  case C::CAtom: return &TheAtomOps;
  case C::CStarExpression: return &TheStarOps;
  case C::CLambdaExpr: return &TheLambdaOps;
  case C::CYieldExpr: return &TheYieldExprOps;
  case C::CTestListStarExpr: return &TheTestListOps;
  case C::CAtomExpr: return &TheAtomExprOps;
  case C::CPower: return &ThePowerOps;
  case C::CNumberLiteral: return &TheNumberOps;
  case C::CStringLiteral: return &TheStringOps;
  case C::CFactorExpr: return &TheFactorOps;
  case C::CYieldArg: return &TheYieldArgOps;
  case C::CCompForNode: return &TheCompForOps;
  case C::CListmakerNode: return &TheListmakerOps;
  case C::CTrailer: return &TheTrailerOps;
  default: return nullptr;
  }
}

PyMethodDef *exprClassMethods(NodeClass Cls) {
  switch (Cls) {
  case C::CAtom: return AtomMethods;
  case C::CStarExpression: return StarMethods;
  case C::CYieldExpr: return YieldExprMethods;
  case C::CTestListStarExpr: return TestListMethods;
  case C::CAtomExpr: return AtomExprMethods;
  case C::CPower: return PowerMethods;
  case C::CNumberLiteral: return NumberMethods;
  case C::CStringLiteral: return StringMethods;
  case C::CFactorExpr: return FactorMethods;
  case C::CYieldArg: return YieldArgMethods;
  case C::CCompForNode: return CompForMethods;
  case C::CListmakerNode: return ListmakerMethods;
  case C::CTrailer: return TrailerMethods;
  default: return nullptr;
  }
}

} // namespace treelens
