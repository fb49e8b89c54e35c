// The checks CPython makes on a parsed statement before generating code, over
// one line's parse tree. CPython finds these errors in three passes (building
// the syntax tree, the symbol tables, the code) and reports the first error of
// the earliest pass; each pass here keeps its first error in tree order.
#include "pysource/treelens/checks/checks.h"
#include "pysource/treelens/checks/newsyntax.h"

#include "pysource/treelens/checks/fstrings.h"
#include "pysource/treelens/host/host.h"
#include "pysource/treelens/nodes/node.h"

#include <string.h>

#include <string>
#include <unordered_set>
#include <vector>

namespace treelens {
namespace checks {

using tl::Ref;

namespace {

/// The grammar states and tokens the checks tell apart.
enum class Sym : uint8_t {
  Other,
  // Tokens (leaves).
  Name,
  Number,
  String,
  Op,
  Keyword,
  // Grammar states.
  Atom,
  AtomExpr, // atom_expr and power
  Trailer,
  Arglist,
  Argument,
  TestlistComp, // testlist_comp and listmaker
  DictOrSetMaker,
  CompFor, // comp_for, list_for, old_comp_for
  SyncCompFor,
  Test, // conditional expression
  OrAnd,
  NotTest,
  Comparison,
  BinOp, // expr .. term
  Factor,
  Lambdef,
  StarExpr,
  YieldExpr,
  NamedExpr, // test ':=' test
  Sequence, // testlist, exprlist, testlist_star_expr, testlist_safe, testlist1
  ExprStmt,
  AnnAssign,
  DelStmt,
  ReturnStmt,
  ForStmt,
  WhileStmt,
  IfStmt,
  TryStmt,
  ExceptClause,
  WithStmt,
  WithItem,
  Funcdef,
  AsyncFuncdef,
  AsyncStmt,
  Classdef,
  Parameters,
  ArgsList, // typedargslist, varargslist
  ParamDef, // tfpdef, vfpdef, fpdef
  FpList,
  GlobalStmt,
  NonlocalStmt,
  ImportName,
  ImportFrom,
  ImportAsName,
  DottedAsName,
  NameList, // import_as_names, dotted_as_names
  Decorator,
  Decorated,
  SimpleStmt,
  Suite,
  MatchStmt,
  CaseBlock,
  TypeParams,
  TypeStmt,
  Subscript,
  SubscriptList,
};

struct SymName {
  const char *Name;
  Sym S;
};

const SymName SymNames[] = {
    {"atom", Sym::Atom},
    {"atom_expr", Sym::AtomExpr},
    {"power", Sym::AtomExpr},
    {"trailer", Sym::Trailer},
    {"arglist", Sym::Arglist},
    {"argument", Sym::Argument},
    {"testlist_comp", Sym::TestlistComp},
    {"listmaker", Sym::TestlistComp},
    {"dictorsetmaker", Sym::DictOrSetMaker},
    {"comp_for", Sym::CompFor},
    {"list_for", Sym::CompFor},
    {"old_comp_for", Sym::CompFor},
    {"sync_comp_for", Sym::SyncCompFor},
    {"test", Sym::Test},
    {"or_test", Sym::OrAnd},
    {"and_test", Sym::OrAnd},
    {"not_test", Sym::NotTest},
    {"comparison", Sym::Comparison},
    {"expr", Sym::BinOp},
    {"xor_expr", Sym::BinOp},
    {"and_expr", Sym::BinOp},
    {"shift_expr", Sym::BinOp},
    {"arith_expr", Sym::BinOp},
    {"term", Sym::BinOp},
    {"factor", Sym::Factor},
    {"lambdef", Sym::Lambdef},
    {"lambdef_nocond", Sym::Lambdef},
    {"old_lambdef", Sym::Lambdef},
    {"star_expr", Sym::StarExpr},
    {"yield_expr", Sym::YieldExpr},
    {"namedexpr_test", Sym::NamedExpr},
    {"testlist", Sym::Sequence},
    {"exprlist", Sym::Sequence},
    {"testlist_star_expr", Sym::Sequence},
    {"testlist_safe", Sym::Sequence},
    {"testlist1", Sym::Sequence},
    {"expr_stmt", Sym::ExprStmt},
    {"annassign", Sym::AnnAssign},
    {"del_stmt", Sym::DelStmt},
    {"return_stmt", Sym::ReturnStmt},
    {"for_stmt", Sym::ForStmt},
    {"while_stmt", Sym::WhileStmt},
    {"if_stmt", Sym::IfStmt},
    {"try_stmt", Sym::TryStmt},
    {"except_clause", Sym::ExceptClause},
    {"with_stmt", Sym::WithStmt},
    {"with_item", Sym::WithItem},
    {"funcdef", Sym::Funcdef},
    {"async_funcdef", Sym::AsyncFuncdef},
    {"async_stmt", Sym::AsyncStmt},
    {"classdef", Sym::Classdef},
    {"parameters", Sym::Parameters},
    {"typedargslist", Sym::ArgsList},
    {"varargslist", Sym::ArgsList},
    {"tfpdef", Sym::ParamDef},
    {"tfpdef_star", Sym::ParamDef},
    {"match_stmt", Sym::MatchStmt},
    {"case_block", Sym::CaseBlock},
    {"type_params", Sym::TypeParams},
    {"type_stmt", Sym::TypeStmt},
    {"subscript", Sym::Subscript},
    {"subscriptlist", Sym::SubscriptList},
    {"vfpdef", Sym::ParamDef},
    {"fpdef", Sym::ParamDef},
    {"fplist", Sym::FpList},
    {"global_stmt", Sym::GlobalStmt},
    {"nonlocal_stmt", Sym::NonlocalStmt},
    {"import_name", Sym::ImportName},
    {"import_from", Sym::ImportFrom},
    {"import_as_name", Sym::ImportAsName},
    {"import_as_names", Sym::NameList},
    {"dotted_as_names", Sym::NameList},
    {"decorators", Sym::Decorated},
    {"dotted_as_name", Sym::DottedAsName},
    {"decorator", Sym::Decorator},
    {"decorated", Sym::Decorated},
    {"simple_stmt", Sym::SimpleStmt},
    {"suite", Sym::Suite},
};

/// State names seen so far and their Sym, by the name object (held, so that
/// the address stays that name's). Direct-mapped: a collision just recomputes.
struct SymCacheEntry {
  PyObject *Name = nullptr;
  Sym S = Sym::Other;
};
SymCacheEntry SymCache[512];

Sym symOfName(const char *Name) {
  for (const SymName &E : SymNames)
    if (strcmp(E.Name, Name) == 0)
      return E.S;
  return Sym::Other;
}

/// Token codes of the leaves the checks look at.
enum : int { kName = 1, kNumber = 2, kString = 3, kEllipsis = 52, kAwait = 53, kAsync = 54 };

using N = NodeObject;

inline bool isLeaf(N *X) { return X->Children == nullptr; }
inline Py_ssize_t count(N *X) { return X->Children ? PyList_GET_SIZE(X->Children) : 0; }
/// Stands for a child a grammar of unexpected shape does not have: a leaf
/// with no text and no state, which no check matches.
NodeObject Missing;

inline N *child(N *X, Py_ssize_t I) {
  return I >= 0 && I < count(X) ? reinterpret_cast<N *>(PyList_GET_ITEM(X->Children, I)) : &Missing;
}

/// The leaf's text ("" when it has none).
inline const char *text(N *X) { return X->Text && PyString_Check(X->Text) ? PyString_AS_STRING(X->Text) : ""; }
inline bool textIs(N *X, const char *T) {
  if (!isLeaf(X))
    return false;
  const char *Text = text(X);
  return Text[0] == T[0] && strcmp(Text, T) == 0;
}

/// The keyword leaves' class (the analyzer's node classes are fixed once made).
inline PyTypeObject *keywordType() {
  static PyTypeObject *Type = &nodeType(NodeClass::CKeywordLiteral);
  return Type;
}

Sym symOf(N *X) {
  ClassInfoObject *Info = X->ClsInfo;
  if (!Info)
    return Sym::Other;
  if (isLeaf(X)) {
    switch (Info->NodeType) {
    case kName:
      return Py_TYPE(X) == keywordType() ? Sym::Keyword : Sym::Name;
    case kNumber:
      return Sym::Number;
    case kString:
      return Sym::String;
    case kAwait:
    case kAsync:
      return Sym::Keyword;
    default:
      return Sym::Op;
    }
  }
  PyObject *Name = Info->Name;
  if (!Name || !PyString_Check(Name))
    return Sym::Other;
  SymCacheEntry &E = SymCache[(reinterpret_cast<uintptr_t>(Name) >> 4) % 512];
  if (E.Name != Name) {
    Py_INCREF(Name);
    Py_XSETREF(E.Name, Name);
    E.S = symOfName(PyString_AS_STRING(Name));
  }
  return E.S;
}

/// First leaf of a subtree (its token index locates the subtree).
N *firstLeaf(N *X) {
  while (!isLeaf(X) && count(X) > 0)
    X = child(X, 0);
  return X;
}

/// Whether a string token's prefix has the letter Lower, in either case.
inline bool prefixHas(N *X, char Lower) {
  const char *T = text(X);
  for (; *T && *T != '\'' && *T != '"'; ++T)
    if (*T == Lower || *T == Lower - 'a' + 'A')
      return true;
  return false;
}

inline bool isFString(N *X) { return prefixHas(X, 'f'); }

/// The await keyword (a plain name where the version has no such keyword).
inline bool isAwait(N *X) {
  return textIs(X, "await") && X->ClsInfo &&
         (X->ClsInfo->NodeType == kAwait || Py_TYPE(X) == keywordType());
}

/// The expression inside grouping parentheses: (x) is x, but (x,), (x for
/// x in y) and (yield) are expressions of their own.
N *strip(N *X) {
  while (!isLeaf(X) && count(X) == 3 && symOf(X) == Sym::Atom && textIs(child(X, 0), "(")) {
    N *In = child(X, 1);
    Sym S = symOf(In);
    if (S == Sym::TestlistComp || S == Sym::YieldExpr || textIs(In, "yield"))
      break;
    X = In;
  }
  return X;
}

/// The starred expression that X only wraps in parentheses, as in `(*a)`, or
/// nullptr: the syntax tree keeps it as a starred item of what holds X.
N *parenStarred(N *X) {
  N *In = strip(X);
  return In != X && symOf(In) == Sym::StarExpr ? In : nullptr;
}

/// What a subtree becomes in CPython's syntax tree, as far as the checks care.
enum class Kind : uint8_t {
  Name,
  NameConstant, // None, True, False under Python 3
  Attribute,
  Subscript,
  Starred,
  List,
  Tuple,
  EmptyTuple,
  Call,
  Operator,
  GeneratorExp,
  Yield,
  Await,
  ListComp,
  SetComp,
  DictComp,
  Literal, // numbers and strings
  FString,
  DictDisplay,
  SetDisplay,
  NamedExpr,
  Ellipsis,
  Compare,
  IfExp,
  Lambda,
  Repr,
  Other,
};

/// Which pass of CPython's finds an error.
enum Pass : int { kParse, kAst, kFuture, kSymtable, kCompile, kPassCount };

/// The kinds of block a statement can sit in.
enum class Block : uint8_t { Module, Class, Function, AsyncFunction, Lambda, Comprehension };

struct Scope {
  Block B;
  const Scope *Outer;               ///< nullptr at the line's outermost scope
  bool InLoop = false;               ///< a loop of this line encloses the statement
  bool NoLoop = false;               ///< no loop can enclose it (a fresh scope or the module's top level)
  bool InFinally = false;            ///< directly in a finally clause of this line
  std::vector<std::string> *Params = nullptr; ///< parameter names of a def or lambda of this line
  const char *Comprehension = nullptr;         ///< what a comprehension scope builds
  N *ComprehensionAt = nullptr;                ///< the comprehension, where CPython places its errors
  std::vector<std::string> *IterVars = nullptr; ///< a comprehension's iteration variables
  bool InIterable = false;                     ///< in the iterable of a comprehension clause
  bool *Awaits = nullptr;                      ///< set when the comprehension awaits
  /// Asynchronous comprehensions directly in this comprehension's scope: errors
  /// unless it is asynchronous itself, which its later clauses may decide.
  std::vector<N *> *AsyncInside = nullptr;
};

/// How CPython gives the offset of an error.
enum class Offset : uint8_t {
  Node,      ///< the node's column: 0-based before 3.8, 1-based from 3.8 on (none in 2.7)
  LineStart, ///< 0 whatever the node
  ZeroBased, ///< the node's 0-based column in every version
  FString,   ///< as Node; before 3.8 a string over several lines gives its last line and offset -1
  OneBased,  ///< the 1-based column, as the parser gives it
};

struct Found {
  bool Set = false;
  std::string Msg;
  Py_ssize_t TokI = 0;
  int ColDelta = 0;  ///< added to the column of the token (the parser's errors point past a token)
  Offset How = Offset::Node;
  bool Placed = false; ///< in an f-string's expression: Row and Col place it in the line
  long Row = 0, Col = 0;
};

/// The record whose tokens the tree being checked holds: the line's own, or
/// that of an f-string expression, "(" text ")", placed in its parent's
/// coordinates with its "(" at (Row, Col).
struct Frame {
  host::LogicalLineObject *L;
  const Frame *Parent;
  long Row, Col;
};

class Checker {
public:
  Checker(ParserObject *P, PyObject *Logical)
      : Parser(P), Logical(Logical), L(reinterpret_cast<host::LogicalLineObject *>(Logical)), Top{L, nullptr, 0, 0},
        Cur(&Top) {
    Py3 = P->Py3Grammar;
    Minor = 0;
    if (P->VersionTriple && PyTuple_Check(P->VersionTriple) && PyTuple_GET_SIZE(P->VersionTriple) >= 2) {
      long M = PyInt_AsLong(PyTuple_GET_ITEM(P->VersionTriple, 1));
      if (M == -1 && PyErr_Occurred())
        PyErr_Clear();
      else
        Minor = static_cast<int>(M);
    }
    Py38 = Py3 && Minor >= 8;
  }

  void run(N *Tree);

private:
  ParserObject *Parser;
  PyObject *Logical;
  host::LogicalLineObject *L;
  Frame Top;
  const Frame *Cur; ///< the record of the tree being checked
  bool Py3;
  bool Py38 = false; ///< 3.8's messages and 1-based offsets
  int Depth = 0;
  int Minor;
  Found First[kPassCount];

  void report(Pass P, N *At, std::string Msg, int ColDelta = 0, Offset How = Offset::Node) {
    if (First[P].Set)
      return;
    reportAt(P, tokenIndex(At), std::move(Msg), ColDelta, How);
  }
  static Py_ssize_t tokenIndex(N *At) {
    N *Leaf = firstLeaf(At);
    return Leaf->Context && PyInt_Check(Leaf->Context) ? PyInt_AS_LONG(Leaf->Context) : 0;
  }
  void reportAt(Pass P, Py_ssize_t TokI, std::string Msg, int ColDelta = 0, Offset How = Offset::Node);
  void raise();

  // F-strings.
  void strings(N *X, const Scope &S);
  bool fstring(N *Tok, N *Atom, const Scope &S);
  void fieldExpression(N *Tok, Py_ssize_t Begin, Py_ssize_t End, const Scope &S);
  void place(const Frame *F, Py_ssize_t TokI, long &Row, long &Col) const;

  // Statements.
  void stmt(N *X, const Scope &S);
  void exprStmt(N *X, const Scope &S);
  void annAssign(N *Target, N *Ann, const Scope &S);
  void loopStmt(N *X, const Scope &S);
  void ifStmt(N *X, const Scope &S);
  void tryStmt(N *X, const Scope &S);
  void withStmt(N *X, const Scope &S);
  void funcdef(N *X, const Scope &S, bool Async, N *At);
  void classdef(N *X, const Scope &S);
  void importStmt(N *X, const Scope &S, bool Top);
  void futureImport(N *X, Py_ssize_t Names, bool Top);
  void namesStmt(N *X, const Scope &S, bool Nonlocal);
  void scopeStmt(N *X, const Scope &S, const char *Word);
  void matchStmt(N *X, const Scope &S);
  void typeParams(N *X, const Scope &S);
  void typeStmt(N *X, const Scope &S);
  ReportFn reporter();

  // Expressions.
  void load(N *X, const Scope &S);
  void elements(N *X, const Scope &S, bool StarOk);
  void atom(N *X, const Scope &S);
  void atomExpr(N *X, const Scope &S);
  void call(N *Args, const Scope &S);
  void comprehension(N *Elt, N *For, const Scope &S, N *At, bool Dict);
  void lambdef(N *X, const Scope &S);
  void yieldExpr(N *X, const Scope &S);
  void starred(N *X, const Scope &S);

  // Targets.
  Kind kindOf(N *X);
  std::string exprName(N *X, Kind K, bool Target);
  void namedExpr(N *X, const Scope &S);
  void target(N *X, bool Del, N *Loc, const Scope &S);
  void setContext(N *X, bool Del, N *Loc);
  void exprlistTargets(N *X, bool Del, const Scope &S);
  void storeName(N *NameLeaf, N *Loc, bool FullChecks);
  void countStars(N *X, bool Top);

  // Parameters.
  void parameters(N *X, const Scope &S, std::vector<std::string> &Names, N *Owner);
  void paramNames(N *X, std::vector<std::string> &Names);

  Scope initialScope();
  static const Scope *function(const Scope &S);
};

// ---- the scope chain ----

Scope Checker::initialScope() {
  Scope S{Block::Module, nullptr};
  PyObject *Parent = L->ParentScope;
  if (Parent && host::isLogical(Parent)) {
    auto *P = reinterpret_cast<host::LogicalLineObject *>(Parent);
    if (P->Kind == 1) {
      S.B = Block::Class;
    } else if (P->Kind == 2) {
      bool Async = P->TokenCount > 0 && P->Texts[0] && PyString_Check(P->Texts[0]) &&
                   strcmp(PyString_AS_STRING(P->Texts[0]), "async") == 0;
      S.B = Async ? Block::AsyncFunction : Block::Function;
    }
  } else {
    // Only a statement at the module's top level is known to be in no loop.
    S.NoLoop = L->Indent == 0;
  }
  return S;
}

/// The innermost def, lambda or comprehension scope, or nullptr.
const Scope *Checker::function(const Scope &S) {
  for (const Scope *P = &S; P; P = P->Outer)
    if (P->B != Block::Module && P->B != Block::Class)
      return P;
  return nullptr;
}

/// Whether a def encloses the statement in the file: a scope of this line, or
/// the record's chain above its innermost def or class.
bool enclosingFunctionBeyond(PyObject *Logical, bool SkipInnermost) {
  auto *L = reinterpret_cast<host::LogicalLineObject *>(Logical);
  PyObject *Parent = L->ParentScope;
  bool Skip = SkipInnermost;
  for (int Steps = 0; Parent && host::isLogical(Parent) && Steps < 1000; ++Steps) {
    auto *P = reinterpret_cast<host::LogicalLineObject *>(Parent);
    if (P->Kind == 2) {
      if (!Skip)
        return true;
    }
    Skip = false;
    Parent = P->ParentScope;
  }
  return false;
}

// ---- statements ----

void Checker::run(N *Tree) {
  Scope S = initialScope();
  stmt(Tree, S);
  raise();
}

/// Bounds the recursion: subtrees nested deeper than this are not checked.
constexpr int kMaxDepth = 300;

struct Deeper {
  int &D;
  explicit Deeper(int &D) : D(D) { ++D; }
  ~Deeper() { --D; }
};

void Checker::stmt(N *X, const Scope &S) {
  Deeper Guard(Depth);
  if (Depth > kMaxDepth)
    return;
  switch (symOf(X)) {
  case Sym::SimpleStmt:
  case Sym::Suite:
    for (Py_ssize_t I = 0; I < count(X); ++I) {
      N *C = child(X, I);
      if (symOf(C) == Sym::ImportFrom)
        importStmt(C, S, Depth == 1 && I == 0 && !S.Outer);
      else if (!isLeaf(C) || symOf(C) == Sym::Keyword || symOf(C) == Sym::Name)
        stmt(C, S);
    }
    return;
  case Sym::ExprStmt:
    return exprStmt(X, S);
  case Sym::DelStmt:
    return exprlistTargets(child(X, 1), true, S);
  case Sym::ReturnStmt:
    scopeStmt(X, S, "return");
    for (Py_ssize_t I = 1; I < count(X); ++I)
      load(child(X, I), S);
    return;
  case Sym::ForStmt:
  case Sym::WhileStmt:
    return loopStmt(X, S);
  case Sym::IfStmt:
    return ifStmt(X, S);
  case Sym::TryStmt:
    return tryStmt(X, S);
  case Sym::WithStmt:
    return withStmt(X, S);
  case Sym::Funcdef:
    return funcdef(X, S, false, X);
  case Sym::AsyncFuncdef:
    return funcdef(child(X, 1), S, true, X);
  case Sym::AsyncStmt: {
    N *Inner = count(X) > 1 ? child(X, 1) : X;
    switch (symOf(Inner)) {
    case Sym::Funcdef:
      return funcdef(Inner, S, true, X);
    case Sym::ForStmt:
    case Sym::WithStmt: {
      if (S.B != Block::AsyncFunction)
        report(kCompile, X, symOf(Inner) == Sym::ForStmt ? "'async for' outside async function"
                                                         : "'async with' outside async function");
      return symOf(Inner) == Sym::ForStmt ? loopStmt(Inner, S) : withStmt(Inner, S);
    }
    default:
      return;
    }
  }
  case Sym::Classdef:
    return classdef(X, S);
  case Sym::Decorated:
    for (Py_ssize_t I = 0; I < count(X); ++I)
      stmt(child(X, I), S);
    return;
  case Sym::MatchStmt:
    return matchStmt(X, S);
  case Sym::TypeStmt:
    return typeStmt(X, S);
  case Sym::Decorator:
    // '@' namedexpr_test NEWLINE (3.9 on)
    if (count(X) == 3)
      return load(child(X, 1), S);
    // '@' dotted_name ['(' [arglist] ')'] NEWLINE
    if (count(X) >= 5 && textIs(child(X, 2), "(") && !textIs(child(X, 3), ")"))
      call(child(X, 3), S);
    return;
  case Sym::ImportName:
  case Sym::ImportFrom:
    return importStmt(X, S, Depth == 1 && !S.Outer);
  case Sym::GlobalStmt:
    return namesStmt(X, S, false);
  case Sym::NonlocalStmt:
    return namesStmt(X, S, true);
  case Sym::Keyword:
    if (textIs(X, "return") || textIs(X, "break") || textIs(X, "continue"))
      return scopeStmt(X, S, text(X));
    if (textIs(X, "yield"))
      return yieldExpr(X, S);
    return;
  case Sym::StarExpr:
    starred(X, S);
    return load(child(X, 1), S);
  case Sym::Other:
    if (!isLeaf(X)) {
      // break_stmt and the like are promoted to their keyword; other statements
      // (raise, assert, print, exec, decorators) only hold expressions.
      for (Py_ssize_t I = 0; I < count(X); ++I)
        load(child(X, I), S);
    }
    return;
  default:
    // An expression statement.
    return load(X, S);
  }
}

ReportFn Checker::reporter() {
  return [this](bool Parse, N *At, const std::string &Msg) { report(Parse ? kParse : kCompile, At, Msg); };
}

/// MATCH subject ':' (NEWLINE | case_block): the subject is read; a lone
/// starred subject is no tuple. A case clause's patterns are checked, its
/// guard read and its body checked as statements.
void Checker::matchStmt(N *X, const Scope &S) {
  Py_ssize_t Colon = 1;
  while (Colon < count(X) && !textIs(child(X, Colon), ":"))
    ++Colon;
  if (Colon == 2 && symOf(child(X, 1)) == Sym::StarExpr)
    report(kParse, child(X, Colon), "invalid syntax");
  for (Py_ssize_t I = 1; I < Colon; ++I) {
    N *C = child(X, I);
    if (symOf(C) == Sym::StarExpr)
      load(child(C, 1), S);
    else
      load(C, S);
  }
  N *Case = child(X, count(X) - 1);
  if (symOf(Case) != Sym::CaseBlock || count(Case) < 4)
    return;
  // CASE patterns [guard] ':' suite
  checkPatterns(child(Case, 1), Minor, reporter());
  for (Py_ssize_t I = 2; I < count(Case); ++I) {
    N *C = child(Case, I);
    if (textIs(C, ":")) {
      if (I + 1 < count(Case))
        stmt(child(Case, I + 1), S);
      return;
    }
    load(C, S);
  }
}

/// A type parameter list: its names, bounds and defaults.
void Checker::typeParams(N *X, const Scope &S) {
  checkTypeParams(X, Minor, reporter());
  for (Py_ssize_t I = 1; I + 1 < count(X); I += 2) {
    N *P = child(X, I);
    for (Py_ssize_t J = 1; J < count(P); ++J) {
      N *C = child(P, J);
      if (symOf(C) == Sym::StarExpr)
        load(child(C, 1), S);
      else if (!isLeaf(C) || symOf(C) == Sym::Name)
        load(C, S);
    }
  }
}

/// TYPE NAME [type_params] '=' test
void Checker::typeStmt(N *X, const Scope &S) {
  if (count(X) < 4)
    return;
  storeName(child(X, 1), child(X, 1), false);
  if (symOf(child(X, 2)) == Sym::TypeParams)
    typeParams(child(X, 2), S);
  load(child(X, count(X) - 1), S);
}

/// return, break and continue: the block they need.
void Checker::scopeStmt(N *X, const Scope &S, const char *Word) {
  if (strcmp(Word, "return") == 0) {
    // Only the innermost scope counts: a class in a def is no function.
    if (S.B == Block::Module || S.B == Block::Class)
      report(kCompile, X, "'return' outside function");
    return;
  }
  bool Break = strcmp(Word, "break") == 0;
  if (S.InLoop)
    return;
  if (!Break && S.InFinally && (!Py3 || Minor < 8)) {
    report(kCompile, X, "'continue' not supported inside 'finally' clause");
    return;
  }
  if (S.NoLoop)
    report(kCompile, X, Break ? "'break' outside loop" : "'continue' not properly in loop");
}

void Checker::exprStmt(N *X, const Scope &S) {
  Py_ssize_t Count = count(X);
  if (Count >= 2 && symOf(child(X, 1)) == Sym::AnnAssign)
    return annAssign(child(X, 0), child(X, 1), S);
  if (Count == 3 && symOf(child(X, 1)) == Sym::Op && !textIs(child(X, 1), "=")) {
    // Augmented assignment: the target must be a name, attribute or subscript.
    N *T = child(X, 0);
    load(T, S);
    setContext(T, false, T);
    Kind K = kindOf(T);
    if (K != Kind::Name && K != Kind::Attribute && K != Kind::Subscript)
      report(kAst, T, "illegal expression for augmented assignment");
    load(child(X, 2), S);
    return;
  }
  for (Py_ssize_t I = 0; I + 2 < Count; I += 2) {
    N *T = child(X, I);
    Sym TS = symOf(T);
    if (TS == Sym::YieldExpr || textIs(T, "yield")) {
      report(kAst, T, "assignment to yield expression not possible");
      yieldExpr(T, S);
      continue;
    }
    target(T, false, T, S);
  }
  load(child(X, Count - 1), S);
}

void Checker::annAssign(N *T, N *Ann, const Scope &S) {
  load(T, S);
  N *E = strip(T);
  switch (kindOf(T)) {
  case Kind::Name:
    if (strcmp(text(E), "__debug__") == 0)
      storeName(E, T, false);
    break;
  case Kind::Attribute: {
    N *Last = child(E, count(E) - 1);
    if (count(Last) == 2 && strcmp(text(child(Last, 1)), "__debug__") == 0)
      storeName(child(Last, 1), T, false);
    break;
  }
  case Kind::Subscript:
    break;
  case Kind::List:
    report(kAst, T, "only single target (not list) can be annotated");
    break;
  case Kind::Tuple:
  case Kind::EmptyTuple:
    report(kAst, T, "only single target (not tuple) can be annotated");
    break;
  default:
    report(kAst, T, "illegal target for annotation");
    break;
  }
  // ':' test ['=' test]
  for (Py_ssize_t I = 1; I < count(Ann); I += 2)
    load(child(Ann, I), S);
}

/// for and while: the header, the body inside the loop, the else clause outside.
void Checker::loopStmt(N *X, const Scope &S) {
  // 'for' exprlist 'in' testlist ':' suite ['else' ':' suite], 'while' test ':' suite [...]
  bool For = textIs(child(X, 0), "for");
  Py_ssize_t Body = For ? 5 : 3;
  if (count(X) <= Body)
    return;
  if (For) {
    exprlistTargets(child(X, 1), false, S);
    load(child(X, 3), S);
  } else {
    load(child(X, 1), S);
  }
  Scope InLoop = S;
  InLoop.InLoop = true;
  InLoop.InFinally = false;
  stmt(child(X, Body), InLoop);
  if (count(X) > Body + 3)
    stmt(child(X, Body + 3), S);
}

void Checker::ifStmt(N *X, const Scope &S) {
  for (Py_ssize_t I = 0; I < count(X); ++I) {
    N *C = child(X, I);
    if (textIs(C, "if") || textIs(C, "elif")) {
      if (I + 1 < count(X))
        load(child(X, I + 1), S);
      ++I;
    } else if (!textIs(C, ":") && !textIs(C, "else")) {
      stmt(C, S);
    }
  }
}

void Checker::tryStmt(N *X, const Scope &S) {
  for (Py_ssize_t I = 0; I + 2 < count(X); ++I) {
    N *C = child(X, I);
    if (!textIs(child(X, I + 1), ":"))
      continue;
    N *Body = child(X, I + 2);
    Scope BS = S;
    if (symOf(C) == Sym::ExceptClause) {
      // 'except' ['*'] [test [('as' | ',') test]]
      Py_ssize_t Star = textIs(child(C, 1), "*") ? 1 : 0;
      if (count(C) >= 2 + Star)
        load(child(C, 1 + Star), S);
      if (count(C) >= 4 + Star) {
        N *T = child(C, 3 + Star);
        if (Py3)
          storeName(T, T, false);
        else
          target(T, false, T, S);
      }
    } else if (textIs(C, "finally")) {
      BS.InFinally = true;
    }
    stmt(Body, BS);
    I += 2;
  }
}

void Checker::withStmt(N *X, const Scope &S) {
  for (Py_ssize_t I = 1; I < count(X); ++I) {
    N *C = child(X, I);
    if (textIs(C, ","))
      continue;
    if (textIs(C, ":")) {
      if (I + 1 < count(X))
        stmt(child(X, I + 1), S);
      return;
    }
    if (symOf(C) == Sym::WithItem && count(C) == 3) {
      load(child(C, 0), S);
      target(child(C, 2), false, C, S);
    } else {
      load(C, S);
    }
  }
}

void Checker::funcdef(N *X, const Scope &S, bool Async, N *At) {
  // 'def' NAME parameters ['->' test] ':' suite
  if (count(X) < 5)
    return;
  storeName(child(X, 1), child(X, 1), false);
  std::vector<std::string> Names;
  Py_ssize_t Shift = symOf(child(X, 2)) == Sym::TypeParams ? 1 : 0;
  if (Shift)
    typeParams(child(X, 2), S);
  N *Params = child(X, 2 + Shift);
  parameters(Params, S, Names, At);
  Py_ssize_t I = 3 + Shift;
  if (textIs(child(X, I), "->")) {
    load(child(X, I + 1), S);
    I += 2;
  }
  Scope Body{Async ? Block::AsyncFunction : Block::Function, &S};
  Body.NoLoop = true;
  Body.Params = &Names;
  if (I + 1 < count(X))
    stmt(child(X, I + 1), Body);
}

void Checker::classdef(N *X, const Scope &S) {
  // 'class' NAME ['(' [arglist] ')'] ':' suite
  if (count(X) < 4)
    return;
  storeName(child(X, 1), child(X, 3), false);
  Py_ssize_t I = 2;
  if (symOf(child(X, 2)) == Sym::TypeParams)
    typeParams(child(X, I++), S);
  if (textIs(child(X, I), "(")) {
    if (!textIs(child(X, I + 1), ")")) {
      if (Py3)
        call(child(X, I + 1), S);
      else
        load(child(X, I + 1), S);
    }
    while (I < count(X) && !textIs(child(X, I), ":"))
      ++I;
  }
  Scope Body{Block::Class, &S};
  Body.NoLoop = true;
  if (I + 1 < count(X))
    stmt(child(X, I + 1), Body);
}

void Checker::importStmt(N *X, const Scope &S, bool Top) {
  // The names a statement binds: 'as' names, and names without a dot.
  auto bound = [&](N *Item) {
    Sym IS = symOf(Item);
    if (IS == Sym::Name || IS == Sym::Keyword)
      storeName(Item, Item, false);
    else if ((IS == Sym::ImportAsName || IS == Sym::DottedAsName) && count(Item) == 3)
      storeName(child(Item, 2), child(Item, 2), false);
  };
  auto names = [&](N *List) {
    if (symOf(List) != Sym::NameList)
      return bound(List);
    for (Py_ssize_t I = 0; I < count(List); I += 2)
      bound(child(List, I));
  };
  if (symOf(X) == Sym::ImportName) {
    if (count(X) == 2)
      names(child(X, 1));
    return;
  }
  // 'from' module 'import' ('*' | '(' names ')' | names)
  for (Py_ssize_t I = 1; I + 1 < count(X); ++I) {
    if (!textIs(child(X, I), "import"))
      continue;
    N *What = child(X, I + 1);
    if (I == 2 && textIs(child(X, 1), "__future__"))
      futureImport(X, I + 1, Top && L->Indent == 0 && !(L->ParentScope && host::isLogical(L->ParentScope)));
    if (textIs(What, "*")) {
      if (Py3 && S.B != Block::Module)
        report(kSymtable, X, "import * only allowed at module level");
    } else if (textIs(What, "(")) {
      if (I + 2 < count(X))
        names(child(X, I + 2));
    } else {
      if (symOf(What) == Sym::NameList && textIs(child(What, count(What) - 1), ","))
        report(kAst, What, "trailing comma not allowed without surrounding parentheses");
      names(What);
    }
    return;
  }
}

/// from __future__ import: only first in the file, and only known features.
void Checker::futureImport(N *X, Py_ssize_t Names, bool Top) {
  if (!Top) {
    // Not at the module's top level: past the beginning of the file.
    report(kCompile, X, "from __future__ imports must occur at the beginning of the file");
    return;
  }
  static const char *const Features[] = {"nested_scopes", "generators",      "division",       "absolute_import",
                                         "with_statement", "print_function", "unicode_literals", nullptr};
  static const char *const Py3Features[] = {"barry_as_FLUFL", "generator_stop", nullptr};
  std::vector<N *> Items;
  N *What = child(X, Names);
  if (textIs(What, "(") && Names + 1 < count(X))
    What = child(X, Names + 1);
  if (symOf(What) == Sym::NameList) {
    for (Py_ssize_t I = 0; I < count(What); I += 2)
      Items.push_back(child(What, I));
  } else {
    Items.push_back(What);
  }
  for (N *Item : Items) {
    N *Feature = isLeaf(Item) ? Item : child(Item, 0);
    const char *Name = text(Feature);
    bool Known = false;
    for (const char *const *F = Features; *F; ++F)
      Known = Known || strcmp(*F, Name) == 0;
    for (const char *const *F = Py3Features; Py3 && *F; ++F)
      Known = Known || strcmp(*F, Name) == 0;
    Known = Known || (Py3 && Minor >= 7 && strcmp(Name, "annotations") == 0);
    if (Known)
      continue;
    if (strcmp(Name, "braces") == 0)
      report(kFuture, X, "not a chance");
    else
      report(kFuture, X, std::string("future feature ") + Name + " is not defined");
    return;
  }
}

void Checker::namesStmt(N *X, const Scope &S, bool Nonlocal) {
  const Scope *F = function(S);
  if (F && F->Params && F == &S && !F->Params->empty()) {
    // One set of the parameters, so that many names against many parameters stay linear.
    std::unordered_set<std::string> Params(F->Params->begin(), F->Params->end());
    for (Py_ssize_t I = 1; I < count(X); I += 2) {
      N *Name = child(X, I);
      if (Params.count(text(Name))) {
        std::string Msg = std::string("name '") + text(Name) + "' is " + (Py3 ? "parameter" : "local") +
                          " and " + (Nonlocal ? "nonlocal" : "global");
        report(kSymtable, X, Msg);
        return;
      }
    }
  }
  if (!Nonlocal)
    return;
  if (S.B == Block::Module) {
    report(kSymtable, X, "nonlocal declaration not allowed at module level");
    return;
  }
  // The names must be bound in an enclosing def: none means no binding.
  bool Enclosing = false;
  for (const Scope *P = S.B == Block::Class ? &S : S.Outer; P; P = P->Outer)
    if (P->B != Block::Module && P->B != Block::Class)
      Enclosing = true;
  if (!Enclosing) {
    bool LineScope = S.Outer != nullptr; // S was opened by a def or class of this line
    Enclosing = enclosingFunctionBeyond(Logical, !LineScope && S.B != Block::Class);
  }
  // A method's __class__ is bound by its class, whatever the chain shows.
  if (!Enclosing && strcmp(text(child(X, 1)), "__class__") != 0)
    report(kSymtable, X, std::string("no binding for nonlocal '") + text(child(X, 1)) + "' found");
}

// ---- expressions ----

void Checker::load(N *X, const Scope &S) {
  Deeper Guard(Depth);
  if (Depth > kMaxDepth)
    return;
  if (isLeaf(X)) {
    if (Py3 && Minor >= 6 && symOf(X) == Sym::String && isFString(X))
      fstring(X, X, S);
    else if (textIs(X, "yield"))
      yieldExpr(X, S);
    else if (Py3 && textIs(X, "<>"))
      report(kParse, X, "invalid syntax", 1);
    return;
  }
  switch (symOf(X)) {
  case Sym::Atom:
    return atom(X, S);
  case Sym::AtomExpr:
    return atomExpr(X, S);
  case Sym::Lambdef:
    return lambdef(X, S);
  case Sym::YieldExpr:
    return yieldExpr(X, S);
  case Sym::NamedExpr:
    return namedExpr(X, S);
  case Sym::StarExpr:
    starred(X, S);
    return load(child(X, 1), S);
  case Sym::Sequence:
    return elements(X, S, count(X) > 1);
  case Sym::SubscriptList: {
    // A tuple index may unpack items: parenthesized ones before 3.11, unless
    // an item is a slice; any from 3.11 on.
    bool Slices = false;
    for (Py_ssize_t I = 0; I < count(X); ++I) {
      N *C = child(X, I);
      if (textIs(C, ":"))
        Slices = true;
      else if (!isLeaf(C) && (symOf(C) == Sym::Subscript || symOf(C) == Sym::Other))
        for (Py_ssize_t J = 0; J < count(C); ++J)
          Slices = Slices || textIs(child(C, J), ":");
    }
    return elements(X, S, Minor >= 11 || !Slices);
  }
  case Sym::Subscript:
    // namedexpr_test [':' ...]: an assignment expression cannot start a slice.
    if (count(X) > 1 && symOf(child(X, 0)) == Sym::NamedExpr && textIs(child(X, 1), ":"))
      report(kParse, child(X, 1), "invalid syntax");
    for (Py_ssize_t I = 0; I < count(X); ++I)
      load(child(X, I), S);
    return;
  default:
    for (Py_ssize_t I = 0; I < count(X); ++I)
      load(child(X, I), S);
  }
}

/// The items of a list, tuple or set display (StarOk) or of a bracket that
/// only groups (a starred item there is misplaced).
void Checker::elements(N *X, const Scope &S, bool StarOk) {
  for (Py_ssize_t I = 0; I < count(X); ++I) {
    N *C = child(X, I);
    N *Star = symOf(C) == Sym::StarExpr ? C : StarOk ? parenStarred(C) : nullptr;
    if (Star) {
      if (!StarOk)
        starred(Star, S);
      load(child(Star, 1), S);
    } else {
      load(C, S);
    }
  }
}

void Checker::starred(N *X, const Scope &) { report(kCompile, X, "can't use starred expression here"); }

void Checker::atom(N *X, const Scope &S) {
  if (symOf(child(X, 0)) == Sym::String && Py3 && Minor >= 6)
    return strings(X, S);
  if (symOf(child(X, 0)) == Sym::String) {
    // Adjacent literals join into one: Python 3 cannot join bytes and text.
    int Bytes = 0;
    for (Py_ssize_t I = 0; I < count(X); ++I)
      Bytes += prefixHas(child(X, I), 'b');
    if (Py3 && Bytes && Bytes < count(X))
      report(kAst, X, "cannot mix bytes and nonbytes literals");
    return;
  }
  if (count(X) != 3 || !isLeaf(child(X, 0))) {
    for (Py_ssize_t I = 0; I < count(X); ++I)
      load(child(X, I), S);
    return;
  }
  N *Open = child(X, 0), *In = child(X, 1);
  Sym InS = symOf(In);
  bool Paren = textIs(Open, "(");
  if (InS == Sym::TestlistComp || InS == Sym::DictOrSetMaker) {
    Py_ssize_t Count = count(In);
    // A set display's first item may be an assignment expression (3.9), a dictionary key not.
    if (InS == Sym::DictOrSetMaker && symOf(child(In, 0)) == Sym::NamedExpr && textIs(child(In, 1), ":"))
      report(kParse, child(In, 1), "invalid syntax");
    N *Last = child(In, Count - 1);
    Sym LastS = symOf(Last);
    if (LastS == Sym::CompFor || LastS == Sym::SyncCompFor) {
      // A comprehension: elt comp_for, or key ':' value comp_for.
      comprehension(child(In, 0), Last, S, X, InS == Sym::DictOrSetMaker && Count >= 3);
      return;
    }
    if (InS == Sym::DictOrSetMaker) {
      bool Dict = false;
      for (Py_ssize_t I = 0; I < Count; ++I)
        if (textIs(child(In, I), ":") || textIs(child(In, I), "**"))
          Dict = true;
      if (Dict) {
        for (Py_ssize_t I = 0; I < Count; ++I)
          load(child(In, I), S);
        return;
      }
      return elements(In, S, true);
    }
    return elements(In, S, true);
  }
  if (InS == Sym::StarExpr) {
    // [*a] and {*a} are displays; (*a) only groups.
    if (Paren)
      starred(In, S);
    return load(child(In, 1), S);
  }
  if (N *Star = Paren ? nullptr : parenStarred(In))
    return load(child(Star, 1), S); // [(*a)] is [*a]
  load(In, S);
}

void Checker::atomExpr(N *X, const Scope &S) {
  Py_ssize_t I = 0;
  if (count(X) > 0 && isAwait(child(X, 0))) {
    if (S.B == Block::Module || S.B == Block::Class)
      report(kCompile, X, "'await' outside function");
    else if (S.B != Block::AsyncFunction && S.B != Block::Comprehension)
      report(kCompile, X, "'await' outside async function");
    if (S.B == Block::Comprehension && S.Awaits)
      *S.Awaits = true;
    I = 1;
  }
  for (; I < count(X); ++I) {
    N *C = child(X, I);
    if (symOf(C) == Sym::Trailer) {
      // '(' [arglist] ')' | '[' subscriptlist ']' | '.' NAME
      if (textIs(child(C, 0), "(")) {
        if (count(C) == 3)
          call(child(C, 1), S);
      } else if (textIs(child(C, 0), "[")) {
        if (symOf(child(C, 1)) == Sym::StarExpr && Minor >= 11)
          load(child(child(C, 1), 1), S);
        else
          load(child(C, 1), S);
      }
    } else {
      load(C, S);
    }
  }
}

/// Whether an argument node is a generator argument: test comp_for.
bool isGenArgument(N *A) {
  if (symOf(A) != Sym::Argument || count(A) != 2)
    return false;
  Sym S = symOf(child(A, 1));
  return S == Sym::CompFor || S == Sym::SyncCompFor;
}

void Checker::call(N *Args, const Scope &S) {
  bool List = symOf(Args) == Sym::Arglist;
  Py_ssize_t Count = List ? count(Args) : 1;
  auto item = [&](Py_ssize_t I) { return List ? child(Args, I) : Args; };
  // A generator argument must be the only item.
  Py_ssize_t Items = 0, Gens = 0;
  N *FirstGen = nullptr;
  for (Py_ssize_t I = 0; I < Count; ++I) {
    N *A = item(I);
    if (textIs(A, ","))
      continue;
    ++Items;
    if (isGenArgument(A)) {
      ++Gens;
      if (!FirstGen)
        FirstGen = A;
    }
  }
  if (Py3 && Minor >= 7) {
    if (Gens && Count > 1) {
      report(kAst, FirstGen, "Generator expression must be parenthesized");
      return;
    }
  } else {
    if (Gens && (Gens > 1 || Items > 1)) {
      report(kAst, Args, "Generator expression must be parenthesized if not sole argument");
      return;
    }
    if (Items > 255) {
      report(kAst, Args, "more than 255 arguments");
      return;
    }
  }
  int Keywords = 0;
  bool DoubleStars = false, Vararg = false;
  std::unordered_set<std::string> Names; // keyword names so far
  for (Py_ssize_t I = 0; I < Count; ++I) {
    N *A = item(I);
    if (textIs(A, ","))
      continue;
    if (textIs(A, "*") || textIs(A, "**")) {
      // Python 2: '*' test and '**' test are items of the arglist.
      if (I + 1 < Count)
        load(item(I + 1), S);
      if (textIs(A, "*"))
        Vararg = true;
      ++I;
      continue;
    }
    bool Arg = symOf(A) == Sym::Argument;
    if (Arg && isGenArgument(A)) {
      comprehension(child(A, 0), child(A, 1), S, A, false);
      continue;
    }
    if (Arg && count(A) == 2 && (textIs(child(A, 0), "*") || textIs(child(A, 0), "**"))) {
      bool Star = textIs(child(A, 0), "*");
      if (Star && DoubleStars) {
        report(kAst, A, "iterable argument unpacking follows keyword argument unpacking");
        return;
      }
      load(child(A, 1), S);
      if (!Star) {
        DoubleStars = true;
        ++Keywords;
      }
      continue;
    }
    if (Arg && count(A) == 3 && textIs(child(A, 1), "=")) {
      N *Key = child(A, 0);
      load(Key, S);
      Kind K = kindOf(Key);
      if (Py38) {
        // 3.8 wants the NAME token itself (None, True and False are names to it).
        if (symOf(Key) != Sym::Name && symOf(Key) != Sym::Keyword) {
          report(kAst, Key, "expression cannot contain assignment, perhaps you meant \"==\"?");
          return;
        }
        K = Kind::Name;
      }
      if (K == Kind::Lambda) {
        report(kAst, Key, "lambda cannot contain assignment");
        return;
      }
      if (K != Kind::Name) {
        report(kAst, Key, "keyword can't be an expression");
        return;
      }
      N *KeyName = strip(Key);
      storeName(KeyName, Py3 && !Py38 ? A : Key, true);
      if (!Names.insert(text(KeyName)).second) {
        report(kAst, Key, "keyword argument repeated");
        return;
      }
      ++Keywords;
      load(child(A, 2), S);
      continue;
    }
    // A positional argument.
    if (Keywords) {
      report(kAst, A,
             !Py3 ? "non-keyword arg after keyword arg"
                  : DoubleStars ? "positional argument follows keyword argument unpacking"
                                : "positional argument follows keyword argument");
      return;
    }
    if (!Py3 && Vararg) {
      report(kAst, A, "only named arguments may follow *expression");
      return;
    }
    // f(x := 1): the argument holds the assignment expression's parts itself.
    if (Arg && count(A) == 3 && textIs(child(A, 1), ":="))
      namedExpr(A, S);
    else if (N *Star = Py3 ? parenStarred(A) : nullptr)
      load(child(Star, 1), S); // f((*a)) unpacks a as f(*a) does
    else
      load(A, S);
  }
}

void Checker::comprehension(N *Elt, N *For, const Scope &S, N *At, bool Dict) {
  // Python 2 list comprehensions run in the enclosing scope.
  bool List = symOf(At) == Sym::Atom && textIs(child(At, 0), "[");
  bool NewScope = Py3 || !List;
  Scope Inner{Block::Comprehension, &S};
  Inner.NoLoop = true;
  bool Awaits = false;
  Inner.Awaits = &Awaits;
  std::vector<N *> AsyncInside;
  Inner.AsyncInside = &AsyncInside;
  Inner.ComprehensionAt = At;
  Inner.Comprehension = List ? "list comprehension"
                             : symOf(At) != Sym::Atom || textIs(child(At, 0), "(") ? "generator expression"
                                                                                   : Dict ? "dict comprehension"
                                                                                          : "set comprehension";
  const Scope &CS = NewScope ? Inner : S;
  // The iteration variables, which an assignment expression may not rebind.
  std::vector<std::string> Vars;
  if (Py38) {
    Inner.IterVars = &Vars;
    for (N *C = For; C && (symOf(C) == Sym::CompFor || symOf(C) == Sym::SyncCompFor || textIs(child(C, 0), "if"));) {
      Py_ssize_t I = textIs(child(C, 0), "async") ? 1 : 0;
      if (count(C) == 2 && symOf(child(C, 1)) == Sym::SyncCompFor) {
        C = child(C, 1);
        continue;
      }
      if (textIs(child(C, 0), "if")) {
        C = count(C) > 2 ? child(C, 2) : nullptr;
        continue;
      }
      std::vector<N *> Todo{child(C, I + 1)};
      while (!Todo.empty()) {
        N *T = strip(Todo.back());
        Todo.pop_back();
        if (symOf(T) == Sym::Name)
          Vars.push_back(text(T));
        else if (!isLeaf(T))
          for (Py_ssize_t J = 0; J < count(T); ++J)
            Todo.push_back(child(T, J));
      }
      C = count(C) > I + 4 ? child(C, I + 4) : nullptr;
    }
  }
  // The element first (key and value), then the clauses.
  if (Dict) {
    N *In = child(At, 1);
    if (textIs(child(In, 0), "**")) {
      report(kAst, At, "dict unpacking cannot be used in dict comprehension");
      return;
    }
    load(child(In, 0), CS);
    load(child(In, 2), CS);
  } else if (symOf(Elt) == Sym::StarExpr || parenStarred(Elt)) {
    report(kAst, Elt, "iterable unpacking cannot be used in comprehension");
    return;
  } else {
    load(Elt, CS);
  }
  bool First = true, Async = false;
  // [ASYNC] 'for' exprlist 'in' iterable [comp_iter], and 'if' test [comp_iter].
  for (N *C = For; C;) {
    Sym CSym = symOf(C);
    N *Next = nullptr;
    if (CSym == Sym::CompFor || CSym == Sym::SyncCompFor) {
      Py_ssize_t I = 0;
      if (textIs(child(C, 0), "async")) {
        Async = true;
        if (count(C) == 2 && symOf(child(C, 1)) == Sym::SyncCompFor) {
          C = child(C, 1);
          continue;
        }
        I = 1;
      }
      if (count(C) < I + 4)
        break;
      exprlistTargets(child(C, I + 1), false, CS);
      // The first iterable is evaluated in the enclosing scope.
      Scope Iterable = First ? S : CS;
      Iterable.InIterable = true;
      load(child(C, I + 3), Iterable);
      First = false;
      if (count(C) > I + 4)
        Next = child(C, I + 4);
    } else if (!isLeaf(C) && count(C) >= 2 && textIs(child(C, 0), "if")) {
      load(child(C, 1), CS);
      if (count(C) > 2)
        Next = child(C, 2);
    } else {
      load(C, CS);
    }
    C = Next;
  }
  // A comprehension that awaits or iterates asynchronously must be directly in
  // an async def or in a comprehension that is asynchronous itself (not in a
  // module or class body), but for a generator expression from 3.7 on; from
  // 3.11 on, in an async def through any comprehensions.
  const char *OutsideAsync = "asynchronous comprehension outside of an asynchronous function";
  if (!(Async || Awaits))
    for (N *Inside : AsyncInside)
      report(kCompile, Inside, OutsideAsync, 0, Offset::LineStart);
  bool GenExp = NewScope && !List && (symOf(At) != Sym::Atom || textIs(child(At, 0), "("));
  if ((Async || Awaits) && Py3 && !(GenExp && Minor >= 7)) {
    const Scope *F = function(S);
    // From 3.11 on the comprehensions around it become asynchronous
    // themselves: what counts is the function around them.
    if (Minor >= 11)
      while (F && F->B == Block::Comprehension)
        F = F->Outer ? function(*F->Outer) : nullptr;
    if (F && F->B == Block::Comprehension && F->AsyncInside)
      F->AsyncInside->push_back(At);
    else if (!F || F->B != Block::AsyncFunction) // a module or class body too
      report(kCompile, At, OutsideAsync, 0, Offset::LineStart);
  }
}

/// An assignment expression: NAME ':=' test, binding in the enclosing
/// function whatever comprehensions it sits in.
void Checker::namedExpr(N *X, const Scope &S) {
  N *T = child(X, 0);
  load(T, S);
  Kind K = kindOf(T);
  if (K != Kind::Name) {
    std::string What = exprName(T, K, false);
    if (!What.empty())
      report(kAst, X, "cannot use assignment expressions with " + What);
  } else {
    setContext(T, false, X);
    std::string Name = text(strip(T));
    bool InComprehension = false;
    const Scope *P = &S;
    for (; P && P->B == Block::Comprehension; P = P->Outer) {
      InComprehension = true;
      if (P->IterVars)
        for (const std::string &V : *P->IterVars)
          if (V == Name) {
            report(kSymtable, X, "assignment expression cannot rebind comprehension iteration variable '" + Name + "'",
                   0, Offset::ZeroBased);
            return load(child(X, 2), S);
          }
    }
    if (S.InIterable)
      report(kSymtable, X, "assignment expression cannot be used in a comprehension iterable expression", 0,
             Offset::ZeroBased);
    else if (InComprehension && P && P->B == Block::Class)
      report(kSymtable, X, "assignment expression within a comprehension cannot be used in a class body", 0,
             Offset::ZeroBased);
  }
  load(child(X, 2), S);
}

void Checker::lambdef(N *X, const Scope &S) {
  // 'lambda' [varargslist] ':' test
  std::vector<std::string> Names;
  if (count(X) == 4)
    parameters(child(X, 1), S, Names, X);
  Scope Body{Block::Lambda, &S};
  Body.NoLoop = true;
  load(child(X, count(X) - 1), Body);
}

void Checker::yieldExpr(N *X, const Scope &S) {
  if (S.B == Block::Module || S.B == Block::Class) {
    report(kCompile, X, "'yield' outside function");
  } else if (Py3 && Minor >= 8 && S.B == Block::Comprehension) {
    report(kSymtable, S.ComprehensionAt, std::string("'yield' inside ") + S.Comprehension);
  } else if (Py3 && S.B == Block::AsyncFunction && !isLeaf(X) && count(X) == 2 &&
             !isLeaf(child(X, 1)) && count(child(X, 1)) == 2 && textIs(child(child(X, 1), 0), "from")) {
    report(kCompile, X, "'yield from' inside async function");
  }
  if (!isLeaf(X))
    for (Py_ssize_t I = 1; I < count(X); ++I) {
      N *C = child(X, I);
      if (!isLeaf(C) && count(C) == 2 && textIs(child(C, 0), "from"))
        load(child(C, 1), S);
      else
        load(C, S);
    }
}

// ---- assignment targets ----

Kind Checker::kindOf(N *X) {
  if (isLeaf(X)) {
    switch (symOf(X)) {
    case Sym::Name:
      return Kind::Name;
    case Sym::Number:
      return Kind::Literal;
    case Sym::String:
      return isFString(X) ? Kind::FString : Kind::Literal;
    case Sym::Keyword:
      if (textIs(X, "yield"))
        return Kind::Yield;
      if (Py3 && (textIs(X, "None") || textIs(X, "True") || textIs(X, "False")))
        return Kind::NameConstant;
      if (!Py3 && (textIs(X, "None") || textIs(X, "True") || textIs(X, "False")))
        return Kind::Name;
      return Kind::Other;
    default:
      return Py3 && X->ClsInfo && X->ClsInfo->NodeType == kEllipsis ? Kind::Ellipsis : Kind::Other;
    }
  }
  Py_ssize_t Count = count(X);
  switch (symOf(X)) {
  case Sym::Atom: {
    N *Open = child(X, 0);
    if (symOf(Open) == Sym::String) {
      for (Py_ssize_t I = 0; I < Count; ++I)
        if (isFString(child(X, I)))
          return Kind::FString;
      return Kind::Literal;
    }
    if (textIs(Open, "`"))
      return Kind::Repr;
    if (Count == 2)
      return textIs(Open, "(") ? Kind::EmptyTuple : textIs(Open, "[") ? Kind::List : Kind::DictDisplay;
    if (Count != 3)
      return Kind::Other;
    N *In = child(X, 1);
    Sym InS = symOf(In);
    bool Comp = false, Dict = false, Comma = false;
    if (InS == Sym::TestlistComp || InS == Sym::DictOrSetMaker) {
      for (Py_ssize_t I = 0; I < count(In); ++I) {
        N *C = child(In, I);
        Sym CS = symOf(C);
        if (CS == Sym::CompFor || CS == Sym::SyncCompFor)
          Comp = true;
        else if (textIs(C, ":") || textIs(C, "**"))
          Dict = true;
        else if (textIs(C, ","))
          Comma = true;
      }
    }
    if (textIs(Open, "(")) {
      if (InS == Sym::YieldExpr || textIs(In, "yield"))
        return Kind::Yield;
      if (Comp)
        return Kind::GeneratorExp;
      if (Comma)
        return Kind::Tuple;
      return kindOf(In);
    }
    if (textIs(Open, "["))
      return Comp ? Kind::ListComp : Kind::List;
    if (Comp)
      return Dict ? Kind::DictComp : Kind::SetComp;
    return Dict ? Kind::DictDisplay : Kind::SetDisplay;
  }
  case Sym::AtomExpr: {
    if (isAwait(child(X, 0)))
      return Kind::Await;
    for (Py_ssize_t I = 0; I < Count; ++I)
      if (textIs(child(X, I), "**"))
        return Kind::Operator;
    N *Last = child(X, Count - 1);
    if (symOf(Last) != Sym::Trailer)
      return Kind::Other;
    N *Open = child(Last, 0);
    return textIs(Open, "(") ? Kind::Call : textIs(Open, "[") ? Kind::Subscript : Kind::Attribute;
  }
  case Sym::Test:
    return Count >= 2 && textIs(child(X, 1), "if") ? Kind::IfExp : Kind::Other;
  case Sym::Factor:
    // Python 2 folds a negated number into the number.
    if (!Py3 && Count == 2 && textIs(child(X, 0), "-") && symOf(child(X, 1)) == Sym::Number)
      return Kind::Literal;
    return Kind::Operator;
  case Sym::OrAnd:
  case Sym::NotTest:
  case Sym::BinOp:
    return Kind::Operator;
  case Sym::Comparison:
    return Kind::Compare;
  case Sym::Lambdef:
    return Kind::Lambda;
  case Sym::StarExpr:
    return Kind::Starred;
  case Sym::YieldExpr:
    return Kind::Yield;
  case Sym::NamedExpr:
    return Kind::NamedExpr;
  case Sym::Sequence:
    return Kind::Tuple;
  default:
    return Kind::Other;
  }
}

/// The message of a subtree that cannot be assigned or deleted, or nullptr.
std::string Checker::exprName(N *X, Kind K, bool Target) {
  switch (K) {
  case Kind::Lambda:
    return "lambda";
  case Kind::Call:
    return "function call";
  case Kind::Operator:
    return "operator";
  case Kind::GeneratorExp:
    return "generator expression";
  case Kind::Yield:
    return "yield expression";
  case Kind::Await:
    return "await expression";
  case Kind::ListComp:
    return "list comprehension";
  case Kind::SetComp:
    return "set comprehension";
  case Kind::DictComp:
    return "dict comprehension";
  case Kind::Literal:
    return "literal";
  case Kind::FString:
    return Py38 ? "f-string expression" : "literal";
  case Kind::DictDisplay:
    return Py38 ? "dict display" : "literal";
  case Kind::SetDisplay:
    return Py38 ? "set display" : "literal";
  case Kind::NameConstant:
    return Py38 ? text(strip(X)) : "keyword";
  case Kind::Ellipsis:
    return "Ellipsis";
  case Kind::Compare:
    return "comparison";
  case Kind::IfExp:
    return "conditional expression";
  case Kind::Repr:
    return "repr";
  case Kind::NamedExpr:
    return "named expression";
  case Kind::EmptyTuple:
    return Target ? (Py3 ? "" : "()") : "tuple";
  // Only an assignment expression's target names these.
  case Kind::Attribute:
    return Target ? "" : "attribute";
  case Kind::Subscript:
    return Target ? "" : "subscript";
  case Kind::Starred:
    return Target ? "" : "starred";
  case Kind::List:
    return Target ? "" : "list";
  case Kind::Tuple:
    return Target ? "" : "tuple";
  default:
    return "";
  }
}

/// A name bound by the statement: __debug__ (and None in Python 2) cannot be.
void Checker::storeName(N *NameLeaf, N *Loc, bool FullChecks) {
  const char *T = text(NameLeaf);
  if (Py3) {
    if (strcmp(T, "__debug__") == 0 ||
        (FullChecks && (strcmp(T, "None") == 0 || strcmp(T, "True") == 0 || strcmp(T, "False") == 0)))
      report(kAst, Loc, Py38 ? std::string("cannot assign to ") + T : std::string("assignment to keyword"));
  } else if (strcmp(T, "None") == 0 || strcmp(T, "__debug__") == 0) {
    report(kAst, Loc, std::string("cannot assign to ") + T);
  }
}

/// set_context: whether X can be assigned (or deleted), reported at Loc.
void Checker::setContext(N *X, bool Del, N *Loc) {
  X = strip(X);
  Kind K = kindOf(X);
  switch (K) {
  case Kind::Name:
    if (!Del)
      storeName(X, Loc, false);
    return;
  case Kind::Attribute:
    if (!Del) {
      N *Last = child(X, count(X) - 1);
      if (count(Last) == 2)
        storeName(child(Last, 1), Loc, true);
    }
    return;
  case Kind::Subscript:
    return;
  case Kind::Starred:
    return setContext(child(X, 1), Del, Loc);
  case Kind::Tuple:
  case Kind::List: {
    N *Seq = X;
    if (symOf(X) == Sym::Atom) {
      if (count(X) != 3)
        return;
      Seq = child(X, 1);
      if (symOf(Seq) != Sym::TestlistComp && symOf(Seq) != Sym::Sequence)
        return setContext(Seq, Del, Loc);
    }
    for (Py_ssize_t I = 0; I < count(Seq); I += 2)
      setContext(child(Seq, I), Del, Loc);
    return;
  }
  default:
    break;
  }
  std::string What = exprName(X, K, true);
  if (!What.empty())
    report(kAst, Loc, std::string(Py38 ? (Del ? "cannot delete " : "cannot assign to ")
                                       : (Del ? "can't delete " : "can't assign to ")) + What);
}

/// The items of a list or tuple target (or the target itself).
static N *sequenceOf(N *X, Kind K) {
  if (K != Kind::Tuple && K != Kind::List)
    return nullptr;
  X = strip(X);
  if (symOf(X) == Sym::Atom) {
    if (count(X) != 3)
      return nullptr;
    N *In = child(X, 1);
    return symOf(In) == Sym::TestlistComp || symOf(In) == Sym::Sequence ? In : nullptr;
  }
  return X;
}

/// The starred items of a store target, for the code generator's checks.
void Checker::countStars(N *X, bool Top) {
  X = strip(X);
  Kind K = kindOf(X);
  if (K == Kind::Starred) {
    if (Top)
      report(kCompile, X, "starred assignment target must be in a list or tuple");
    // The item a starred target unpacks into is not in a list or tuple itself.
    countStars(child(X, 1), true);
    return;
  }
  N *Seq = sequenceOf(X, K);
  if (!Seq) {
    // [x] and [*x]: a one-item list.
    if (K == Kind::List && symOf(X) == Sym::Atom && count(X) == 3)
      countStars(child(X, 1), false);
    return;
  }
  int Stars = 0;
  for (Py_ssize_t I = 0; I < count(Seq); I += 2)
    if (kindOf(child(Seq, I)) == Kind::Starred)
      ++Stars;
  if (Stars > 1)
    report(kCompile, X, "two starred expressions in assignment");
  for (Py_ssize_t I = 0; I < count(Seq); I += 2) {
    N *C = strip(child(Seq, I));
    countStars(kindOf(C) == Kind::Starred ? child(C, 1) : C, kindOf(C) == Kind::Starred);
  }
}

/// One assignment target: its expressions first, then whether it can be bound.
void Checker::target(N *X, bool Del, N *Loc, const Scope &S) {
  // The target's own expressions, with its starred items allowed.
  std::vector<N *> Todo{X}, Stars;
  while (!Todo.empty()) {
    N *Y = strip(Todo.back());
    Todo.pop_back();
    Kind K = kindOf(Y);
    if (K == Kind::Starred) {
      Stars.push_back(Y);
      Todo.push_back(child(Y, 1));
    } else if (N *Seq = sequenceOf(Y, K)) {
      for (Py_ssize_t I = count(Seq); I-- > 0;)
        if (!textIs(child(Seq, I), ","))
          Todo.push_back(child(Seq, I));
    } else if (K == Kind::List && symOf(Y) == Sym::Atom && count(Y) == 3) {
      Todo.push_back(child(Y, 1));
    } else {
      load(Y, S);
    }
  }
  setContext(X, Del, Loc);
  if (Del) {
    // del *a: a starred item has nowhere to go.
    if (!Stars.empty())
      starred(Stars.front(), S);
  } else if (Py3) {
    countStars(X, true);
  }
}

/// The targets of del, for and comprehension clauses: each item of an
/// exprlist is its own target, located at itself.
void Checker::exprlistTargets(N *X, bool Del, const Scope &S) {
  if (symOf(X) != Sym::Sequence) {
    target(X, Del, X, S);
    return;
  }
  int Stars = 0;
  for (Py_ssize_t I = 0; I < count(X); I += 2) {
    N *C = child(X, I);
    N *Inner = strip(C);
    // for a, *b in x: the items unpack together, so a starred item is fine.
    if (!Del && Py3 && kindOf(Inner) == Kind::Starred) {
      ++Stars;
      target(child(Inner, 1), false, C, S);
    } else {
      target(C, Del, C, S);
    }
  }
  if (Stars > 1)
    report(kCompile, X, "two starred expressions in assignment");
}

// ---- parameters ----

void Checker::paramNames(N *X, std::vector<std::string> &Names) {
  if (isLeaf(X)) {
    if (symOf(X) == Sym::Name || symOf(X) == Sym::Keyword)
      Names.push_back(text(X));
    return;
  }
  Sym XS = symOf(X);
  if (XS == Sym::ParamDef) {
    // NAME [':' test], or '(' fplist ')'
    if (textIs(child(X, 0), "("))
      paramNames(child(X, 1), Names);
    else
      paramNames(child(X, 0), Names);
  } else if (XS == Sym::FpList) {
    for (Py_ssize_t I = 0; I < count(X); I += 2)
      paramNames(child(X, I), Names);
  }
}

void Checker::parameters(N *X, const Scope &S, std::vector<std::string> &Names, N *Owner) {
  if (symOf(X) == Sym::Parameters) {
    // '(' [typedargslist] ')'
    if (count(X) != 3)
      return;
    X = child(X, 1);
  }
  std::vector<N *> Items;
  if (symOf(X) == Sym::ArgsList) {
    for (Py_ssize_t I = 0; I < count(X); ++I)
      Items.push_back(child(X, I));
  } else {
    Items.push_back(X);
  }
  // The parameters in order: names, defaults, the bare '*' rule.
  bool FoundDefault = false, KeywordOnly = false;
  size_t Count = Items.size();
  for (size_t I = 0; I < Count; ++I) {
    N *C = Items[I];
    if (textIs(C, ",") || textIs(C, "/"))
      continue;
    if (textIs(C, "*") || textIs(C, "**")) {
      bool Star = textIs(C, "*");
      bool HasName = I + 1 < Count && !textIs(Items[I + 1], ",");
      if (Star && !HasName) {
        // A bare '*' needs a named parameter after it.
        bool Named = false;
        for (size_t J = I + 1; J < Count; ++J) {
          if (textIs(Items[J], "**"))
            break;
          if (!isLeaf(Items[J]) || symOf(Items[J]) == Sym::Name) {
            Named = true;
            break;
          }
        }
        if (!Named && Py3) {
          // CPython points at the item after ", " (the '**'), or at the '*'.
          N *At = C;
          if (I + 2 < Count)
            At = Items[I + 2];
          report(kAst, At, "named arguments must follow bare *");
          return;
        }
      }
      if (Star)
        KeywordOnly = true;
      if (HasName) {
        N *P = Items[I + 1];
        N *NameLeaf = isLeaf(P) ? P : child(P, 0);
        storeName(NameLeaf, NameLeaf, false);
        if (!isLeaf(P) && count(P) == 3) {
          // `*args: *Ts` (3.11): the grammar admits a starred annotation only here.
          N *Ann = child(P, 2);
          load(symOf(Ann) == Sym::StarExpr ? child(Ann, 1) : Ann, S);
        }
        paramNames(P, Names);
        ++I;
      }
      continue;
    }
    // A parameter, maybe with '=' default.
    N *NameLeaf = isLeaf(C) ? C : textIs(child(C, 0), "(") ? nullptr : child(C, 0);
    bool Default = I + 1 < Count && textIs(Items[I + 1], "=");
    if (Default) {
      load(Items[I + 2], S);
      if (!KeywordOnly)
        FoundDefault = true;
    } else if (FoundDefault && !KeywordOnly) {
      report(kAst, Py3 ? X : C, "non-default argument follows default argument");
      return;
    }
    if (NameLeaf) {
      storeName(NameLeaf, NameLeaf, false);
      if (!isLeaf(C) && count(C) == 3)
        load(child(C, 2), S);
    }
    paramNames(C, Names);
    if (Default)
      I += 2;
  }
  // The first name that repeats an earlier one, found in one pass.
  std::unordered_set<std::string> Seen;
  for (const std::string &Name : Names) {
    if (!Seen.insert(Name).second) {
      report(kSymtable, Owner, "duplicate argument '" + Name + "' in function definition");
      return;
    }
  }
}

// ---- f-strings ----

void Checker::reportAt(Pass P, Py_ssize_t TokI, std::string Msg, int ColDelta, Offset How) {
  if (First[P].Set)
    return;
  Found &F = First[P];
  F.Set = true;
  F.Msg = std::move(Msg);
  F.TokI = TokI;
  F.ColDelta = ColDelta;
  F.How = How;
  if (Cur != &Top) {
    F.Placed = true;
    place(Cur, TokI, F.Row, F.Col);
  }
}

/// The line's (row, column) of token TokI of frame F's record (past its last
/// token for an index beyond it).
void Checker::place(const Frame *F, Py_ssize_t TokI, long &Row, long &Col) const {
  host::LogicalLineObject *R = F->L;
  Py_ssize_t Count = R->TokenCount;
  Row = Col = 0;
  if (Count > 0) {
    Py_ssize_t I = TokI < 0 ? 0 : TokI < Count ? TokI : Count - 1;
    Row = R->Positions[I].Row;
    Col = R->Positions[I].Col;
    PyObject *T = R->Texts[I];
    if (TokI >= Count && T && PyString_Check(T))
      Col += static_cast<long>(PyString_GET_SIZE(T));
  }
  for (; F->Parent; F = F->Parent) {
    if (Row == 0)
      Col += F->Col;
    Row += F->Row;
  }
}

/// Adjacent string literals, joined in order: a bytes literal beside a text
/// one stops the join, and each f-string is read as CPython reads it.
void Checker::strings(N *X, const Scope &S) {
  bool Bytes = prefixHas(child(X, 0), 'b');
  for (Py_ssize_t I = 0; I < count(X); ++I) {
    N *T = child(X, I);
    if (prefixHas(T, 'b') != Bytes) {
      report(kAst, X, "cannot mix bytes and nonbytes literals");
      return;
    }
    if (isFString(T) && !fstring(T, X, S))
      return;
  }
}

/// One f-string token of the atom At: its fields' expressions are checked in
/// order in the enclosing scope, then the scan's own error, which CPython
/// reports at the atom. False when an error ends the join.
bool Checker::fstring(N *Tok, N *At, const Scope &S) {
  if (!Tok->Text || !PyString_Check(Tok->Text))
    return true;
  FieldScan Scan;
  scanFString(PyString_AS_STRING(Tok->Text), PyString_GET_SIZE(Tok->Text), Py38, Py3 && Minor >= 12, Scan);
  std::size_t Checked = Scan.Failed ? Scan.ErrorAfter : Scan.Exprs.size();
  for (std::size_t I = 0; I < Checked && !First[kParse].Set && !First[kAst].Set; ++I)
    fieldExpression(Tok, Scan.Exprs[I].Begin, Scan.Exprs[I].End, S);
  if (First[kParse].Set || First[kAst].Set)
    return false;
  if (Scan.Failed && !Scan.Error.empty())
    report(kAst, At, Scan.Error, 0, Offset::FString);
  return !Scan.Failed;
}

/// An assignment, annotation or statement separator outside brackets: the
/// expression's text closed the parenthesis around it early.
bool isStatementOperatorText(const char *T) {
  static const char *const Ops[] = {"=",  ":",  ";",  "+=",  "-=",  "*=",  "/=",  "%=", "&=",
                                    "|=", "^=", "<<=", ">>=", "**=", "//=", "@="};
  for (const char *O : Ops)
    if (strcmp(T, O) == 0)
      return true;
  return false;
}

/// Returns a field's tree to the parser's free lists.
struct TreeHold {
  ParserObject *P;
  Ref Tree;
  ~TreeHold() {
    if (Tree && Tree.get() != Py_None && isNode(Tree.get())) {
      PyObject *Type, *Value, *Tb;
      PyErr_Fetch(&Type, &Value, &Tb);
      if (!tl::guard<bool>(false, [&] {
            discardNode(P, Tree.get());
            return true;
          }))
        PyErr_WriteUnraisable(Tree.get());
      PyErr_Restore(Type, Value, Tb);
    }
  }
};

/// The expression Tok[Begin:End] of a field, parsed as CPython parses it,
/// "(" text ")", and checked in the scope S of the f-string.
void Checker::fieldExpression(N *Tok, Py_ssize_t Begin, Py_ssize_t End, const Scope &S) {
  const char *T = PyString_AS_STRING(Tok->Text);
  std::string Text = "(" + std::string(T + Begin, static_cast<std::size_t>(End - Begin)) + ")";
  // The "(" stands on the field's '{': from the token's position, over the
  // lines of the token before it.
  Py_ssize_t TokI = tokenIndex(Tok);
  Frame F{nullptr, Cur, 0, 0};
  {
    host::LogicalLineObject *R = Cur->L;
    Py_ssize_t Count = R->TokenCount;
    Py_ssize_t I = TokI < Count ? TokI : Count - 1;
    if (I < 0)
      return;
    F.Row = R->Positions[I].Row;
    F.Col = R->Positions[I].Col;
    for (Py_ssize_t K = 0; K < Begin - 1; ++K) {
      if (T[K] == '\n' || (T[K] == '\r' && T[K + 1] != '\n')) {
        ++F.Row;
        F.Col = -(K + 1);
      }
    }
    F.Col += Begin - 1;
  }
  Ref Logicals = tl::require(host::Host.Fast->SplitLogicals(Text.data(), static_cast<Py_ssize_t>(Text.size())));
  if (!PyList_Check(Logicals.get()) || PyList_GET_SIZE(Logicals.get()) != 1 ||
      !host::isLogical(PyList_GET_ITEM(Logicals.get(), 0))) {
    // The text ends the parenthesis and goes on over another line.
    report(kAst, Tok, "invalid syntax", 0, Offset::OneBased);
    return;
  }
  PyObject *Sub = PyList_GET_ITEM(Logicals.get(), 0);
  F.L = reinterpret_cast<host::LogicalLineObject *>(Sub);
  struct Enter {
    const Frame *&Cur, *Saved;
    Enter(const Frame *&C, const Frame *F) : Cur(C), Saved(C) { Cur = F; }
    ~Enter() { Cur = Saved; }
  } InField(Cur, &F);
  Py_ssize_t Count = F.L->TokenCount;
  TreeHold Hold{Parser, Ref()};
  // 3.6 reads the expression without the enclosing async def's keywords.
  bool Ok = tl::guard<bool>(false, [&] {
    Hold.Tree = parseToNode(Parser, Sub, false);
    return true;
  });
  if (!Ok) {
    if (PyErr_ExceptionMatches(host::Host.ParseError)) {
      Py_ssize_t At = host::takeParseErrorContext();
      // The closing parenthesis is the last token: CPython's tokenizer has
      // then read to the end, and calls the error an unexpected end.
      bool AtEnd = At >= Count - 1;
      if (!AtEnd && !Py38 && At >= 0 && At < Count && F.L->Texts[At] && PyString_Check(F.L->Texts[At]) &&
          strcmp(PyString_AS_STRING(F.L->Texts[At]), ")") == 0) {
        // An unmatched ')' closes the added parenthesis; the error is then at the last one.
        int Depth = 0;
        for (Py_ssize_t K = 0; K <= At; ++K) {
          const char *X = F.L->Texts[K] && PyString_Check(F.L->Texts[K]) ? PyString_AS_STRING(F.L->Texts[K]) : "";
          Depth += (strcmp(X, "(") == 0 || strcmp(X, "[") == 0 || strcmp(X, "{") == 0) ? 1
                   : (strcmp(X, ")") == 0 || strcmp(X, "]") == 0 || strcmp(X, "}") == 0) ? -1 : 0;
        }
        AtEnd = Depth < 0;
      }
      reportAt(kAst, At, AtEnd ? "unexpected EOF while parsing" : "invalid syntax", 0, Offset::OneBased);
      return;
    }
    if (PyErr_ExceptionMatches(PyExc_SyntaxError)) {
      PyErr_Clear();
      reportAt(kAst, 0, "invalid syntax", 0, Offset::OneBased);
      return;
    }
    throw tl::PyErrSet();
  }
  if (!Hold.Tree || !isNode(Hold.Tree.get()))
    return;
  // Past the added parenthesis only expression tokens may follow.
  int Depth = 0;
  for (Py_ssize_t K = 0; K < Count; ++K) {
    PyObject *X = F.L->Texts[K];
    if (!X || !PyString_Check(X))
      continue;
    const char *XT = PyString_AS_STRING(X);
    if (strcmp(XT, "(") == 0 || strcmp(XT, "[") == 0 || strcmp(XT, "{") == 0)
      ++Depth;
    else if (strcmp(XT, ")") == 0 || strcmp(XT, "]") == 0 || strcmp(XT, "}") == 0)
      --Depth;
    else if (Depth == 0 && isStatementOperatorText(XT)) {
      reportAt(kAst, K, "invalid syntax", 0, Offset::OneBased);
      return;
    }
  }
  stmt(reinterpret_cast<N *>(Hold.Tree.get()), S);
}

// ---- the error ----

void Checker::raise() {
  for (int P = 0; P < kPassCount; ++P) {
    const Found &F = First[P];
    if (!F.Set)
      continue;
    Py_ssize_t Count = L->TokenCount;
    Py_ssize_t I = F.TokI < Count ? F.TokI : Count - 1;
    long Row = F.Placed ? F.Row : I >= 0 ? L->Positions[I].Row : 0;
    long Col = F.Placed ? F.Col : I >= 0 ? L->Positions[I].Col : 0;
    bool EndLine = false;
    if (F.How == Offset::FString && !Py38 && !F.Placed && I >= 0 && L->Texts[I] && PyString_Check(L->Texts[I])) {
      // Before 3.8 a string token over several lines is placed on its last line, at no column.
      const char *T = PyString_AS_STRING(L->Texts[I]);
      for (Py_ssize_t K = 0; K < PyString_GET_SIZE(L->Texts[I]); ++K)
        if (T[K] == '\n' || (T[K] == '\r' && T[K + 1] != '\n')) {
          ++Row;
          EndLine = true;
        }
    }
    Ref Text = tl::require(PyObject_CallMethod(host::Host.LogicalInspect, const_cast<char *>("TextFromTokens"),
                                               const_cast<char *>("(O)"), Logical));
    Ref Msg = tl::require(PyString_FromStringAndSize(F.Msg.data(), static_cast<Py_ssize_t>(F.Msg.size())));
    // CPython 2 gives no column for these errors; CPython 3 the node's 0-based
    // column (the parser's own errors, a 1-based one).
    Ref OffsetObj = Ref::borrow(Py_None);
    long Column = Col + 1 + F.ColDelta;
    if (P == kParse)
      OffsetObj = tl::require(PyInt_FromLong(Col + 1 + F.ColDelta));
    else if (EndLine)
      OffsetObj = tl::require(PyInt_FromLong(-1));
    else if (Py3)
      OffsetObj = tl::require(PyInt_FromLong(F.How == Offset::OneBased ? Col + 1
                                          : F.How == Offset::LineStart ? (Py38 ? 1 : 0)
                                          : F.How == Offset::ZeroBased || !Py38 ? Col
                                                                              : Col + 1));
    Ref Error = tl::require(PyObject_CallFunction(PyExc_SyntaxError, const_cast<char *>("(O(slOO))"), Msg.get(),
                                                  "<string>", Row + 1, OffsetObj.get(), Text.get()));
    // The 1-based column of the place, whatever CPython's offset says.
    Ref ColumnObj = tl::require(PyInt_FromLong(Column));
    tl::requireStatus(PyObject_SetAttrString(Error.get(), "column", ColumnObj.get()));
    PyErr_SetObject(PyExc_SyntaxError, Error.get());
    throw tl::PyErrSet();
  }
}

} // namespace

void checkLine(ParserObject *P, PyObject *Tree, PyObject *Logical, bool InAsyncDef) {
  if (!Tree || !isNode(Tree) || !host::isLogical(Logical))
    return;
  (void)InAsyncDef;
  Checker C(P, Logical);
  C.run(reinterpret_cast<NodeObject *>(Tree));
}

} // namespace checks
} // namespace treelens
