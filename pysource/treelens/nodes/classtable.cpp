// The node class tree: one row per class, with the grammar rules each class represents.
#include "pysource/treelens/nodes/classtable.h"

#include "pysource/treelens/nodes/args.h"
#include "pysource/treelens/nodes/expr.h"
#include "pysource/treelens/nodes/stmt.h"

namespace treelens {

namespace {

const char *const BinaryExpressionRules[] = {
    "test: or_test ['if' or_test 'else' test] | lambdef",
    "or_test: and_test ('or' and_test)*",
    "and_test: not_test ('and' not_test)*",
    "not_test: 'not' not_test | comparison",
    "comparison: expr (comp_op expr)*",
    "expr: xor_expr ('|' xor_expr)*",
    "xor_expr: and_expr ('^' and_expr)*",
    "and_expr: shift_expr ('&' shift_expr)*",
    "shift_expr: arith_expr (('<<'|'>>') arith_expr)*",
    "arith_expr: term (('+'|'-') term)*",
    "term: factor (('*'|'/'|'%'|'//') factor)*",
    nullptr};
const char *const StarExpressionRules[] = {"star_expr: '*' expr", nullptr};
const char *const FunctionParameterDefRules[] = {"fpdef: NAME | '(' fplist ')'", "tfpdef: NAME [':' test]",
                                                 "tfpdef_star: NAME [':' (test | star_expr)]", nullptr};
const char *const DefiningArglistRules[] = {"fplist: fpdef (',' fpdef)* [',']", nullptr};
const char *const SingleDecoratorRules[] = {"decorator: '@' dotted_name [ '(' [arglist] ')' ] NEWLINE",
                                            nullptr};
const char *const DottedNameRules[] = {"dotted_name: NAME ('.' NAME)*", nullptr};
const char *const MultipleDecoratorsRules[] = {"decorators: decorator+", nullptr};
const char *const ExceptClauseRules[] = {"except_clause: 'except' [test [('as' | ',') test]]",
                                         "except_clause: 'except' [test ['as' NAME]]", nullptr};
const char *const AnnotatedAssignRules[] = {"annassign: ':' test ['=' test]",
                                             "annassign: ':' test ['=' (yield_expr|testlist_star_expr)]", nullptr};
const char *const YieldExprRules[] = {"yield_expr: 'yield' [testlist]", "yield_expr: 'yield' [yield_arg]",
                                      nullptr};
const char *const YieldArgRules[] = {"yield_arg: 'from' test | testlist", "yield_arg: 'from' test | testlist_star_expr",
                                      nullptr};
const char *const TestListStarExprRules[] = {
    "exprlist: expr (',' expr)* [',']", "testlist: test (',' test)* [',']",
    "testlist_star_expr: (test|star_expr) (',' (test|star_expr))* [',']",
    "testlist_comp: test ( comp_for | (',' test)* [','] )",
    "testlist_comp: (namedexpr_test|star_expr) ( comp_for | (',' (namedexpr_test|star_expr))* [','] )", nullptr};
const char *const ListmakerRules[] = {"listmaker: test ( list_for | (',' test)* [','] )", nullptr};
const char *const AtomExprRules[] = {"atom_expr: [AWAIT] atom trailer*", nullptr};
const char *const NamedExprRules[] = {"namedexpr_test: test [':=' test]", nullptr};
const char *const CaseBlockRules[] = {"case_block: CASE patterns [guard] ':' suite", nullptr};
const char *const PatternRules[] = {
    "patterns: (pattern | star_pattern) (',' (pattern | star_pattern))* [',']",
    "pattern: or_pattern ['as' NAME]",
    "or_pattern: closed_pattern ('|' closed_pattern)*",
    "literal_pattern: signed_number [('+' | '-') NUMBER] | STRING+ | 'None' | 'True' | 'False'",
    "signed_number: ['-'] NUMBER",
    "name_pattern: NAME ('.' NAME)* ['(' [class_arg (',' class_arg)* [',']] ')']",
    "class_arg: pattern ['=' pattern]",
    "group_pattern: '(' [(pattern | star_pattern) (',' (pattern | star_pattern))* [',']] ')'",
    "sequence_pattern: '[' [(pattern | star_pattern) (',' (pattern | star_pattern))* [',']] ']'",
    "star_pattern: '*' NAME",
    "mapping_pattern: '{' [mapping_item (',' mapping_item)* [',']] '}'",
    "mapping_item: (literal_pattern | value_name) ':' pattern | '**' NAME",
    "value_name: NAME '.' NAME ('.' NAME)*",
    nullptr};
const char *const TypeParamsRules[] = {"type_params: '[' type_param (',' type_param)* [','] ']'", nullptr};
const char *const TypeAliasRules[] = {"type_stmt: TYPE NAME [type_params] '=' test", nullptr};
const char *const PowerRules[] = {"power: atom trailer* ['**' factor]", "power: atom_expr ['**' factor]",
                                  nullptr};

using C = NodeClass;

#define TL_NODE(Cls, Base, Doc, Rules, Final)                                                      \
  NodeClassRow { C::Cls, C::Base, #Cls, "pysource.treelens." #Cls, Doc, Rules, Final, nullptr, nullptr }

/// A row whose class has its own operations: Methods and Ops from Source
/// (exprClass, argsClass or stmtClass), looked up by the class.
#define TL_NODE_OPS(Cls, Base, Doc, Rules, Final, Source)                                                    \
  NodeClassRow {                                                                                             \
    C::Cls, C::Base, #Cls, "pysource.treelens." #Cls, Doc, Rules, Final, Source##Methods(C::Cls),            \
        Source##Ops(C::Cls)                                                                                  \
  }

} // namespace

const std::vector<NodeClassRow> &nodeClassRows() {
  static const std::vector<NodeClassRow> Rows = {
      TL_NODE(CNode, CNode,
              "Base class for parse tree nodes.\n\n"
              "Subclasses define access methods but store nothing more than the base class. "
              "Initialisation is done by the node factory setting the attributes directly rather "
              "than through the constructor, for speed. Nodes are explicitly discarded and kept on "
              "a free list for reuse.",
              nullptr, false),
      TL_NODE(CStmt, CNode, "Base class for statements.", nullptr, false),
      TL_NODE(CExpression, CNode, "Base class for all expressions", nullptr, false),
      TL_NODE_OPS(CAtom, CExpression, "Bracketed atom or a run of adjacent string literals.", nullptr, false,
                  exprClass),
      TL_NODE(CBinaryExpression, CExpression, "Binary, boolean, comparison or conditional expression.",
              BinaryExpressionRules, false),
      TL_NODE_OPS(CStarExpression, CExpression, "Star expression: '*' expr.", StarExpressionRules, false,
                  exprClass),
      TL_NODE_OPS(CImportNamesStmt, CNode, "import statement: 'import' dotted names with 'as'.", nullptr,
                  false, stmtClass),
      TL_NODE_OPS(CFromImportStmt, CNode, "from statement: 'from' module 'import' names.", nullptr, false,
                  stmtClass),
      TL_NODE_OPS(CSingleUsedArgumentNode, CNode,
                  "One call argument of more than one token: keyword, star or generator argument.", nullptr,
                  false, argsClass),
      TL_NODE_OPS(CFunctionParameterDef, CNode,
                  "One parameter with an annotation, or a nested tuple parameter.", FunctionParameterDefRules,
                  false, argsClass),
      TL_NODE(CDefiningArglistNode, CNode, "Parameter list of a def or lambda.", DefiningArglistRules, false),
      TL_NODE(CUsedArglistNode, CNode, "Argument list of a call, decorator or class statement.", nullptr,
              false),
      TL_NODE_OPS(CParametersNode, CNode, "Parenthesised parameters after def NAME.", nullptr, false,
                  argsClass),
      TL_NODE_OPS(CClassdefStmt, CStmt, "class statement.", nullptr, false, stmtClass),
      TL_NODE_OPS(CFuncdefStmt, CStmt, "def statement.", nullptr, false, stmtClass),
      TL_NODE_OPS(CSingleDecorator, CNode, "One decorator line.", SingleDecoratorRules, false, stmtClass),
      TL_NODE(CDottedName, CExpression, "Dotted name: NAME ('.' NAME)*.", DottedNameRules, false),
      TL_NODE(CMultipleDecorators, CNode, "Two or more decorators.", MultipleDecoratorsRules, false),
      TL_NODE_OPS(CLambdaExpr, CExpression, "lambda expression.", nullptr, false, exprClass),
      TL_NODE_OPS(CGlobalStmt, CStmt, "global statement.", nullptr, false, stmtClass),
      TL_NODE_OPS(CNonlocalStmt, CStmt, "nonlocal statement.", nullptr, false, stmtClass),
      TL_NODE_OPS(CForStmt, CStmt, "for statement.", nullptr, false, stmtClass),
      TL_NODE_OPS(CWithStmt, CStmt, "with statement.", nullptr, false, stmtClass),
      TL_NODE_OPS(CWithItem, CNode, "with item with 'as': expression 'as' target.", nullptr, false,
                  stmtClass),
      TL_NODE(CPassStmt, CStmt, "pass statement.", nullptr, false),
      TL_NODE_OPS(CExceptClause, CNode, "except clause.", ExceptClauseRules, false, stmtClass),
      TL_NODE_OPS(CExprStmt, CStmt, "Expression statement: assignments, augmented assignments, annotations.",
                  nullptr, false, stmtClass),
      TL_NODE_OPS(CAnnotatedAssignNode, CNode, "Annotation part of an expression statement.",
                  AnnotatedAssignRules, false, stmtClass),
      TL_NODE(CBinaryOp, CNode, "Binary operator.", nullptr, false),
      TL_NODE(CTestExpr, CExpression, "Test expression.", nullptr, false),
      TL_NODE_OPS(CReturnStmt, CStmt, "return statement.", nullptr, false, stmtClass),
      TL_NODE_OPS(CYieldExpr, CExpression, "yield expression.", YieldExprRules, false, exprClass),
      TL_NODE_OPS(CYieldArg, CNode, "Python 3 yield argument: 'from' test.", YieldArgRules, false, exprClass),
      TL_NODE_OPS(CTestListStarExpr, CExpression,
                  "Comma-separated expression list, or an expression followed by a comprehension clause.",
                  TestListStarExprRules, false, exprClass),
      TL_NODE(CNameLiteral, CExpression, "NAME token.", nullptr, false),
      TL_NODE(CKeywordLiteral, CExpression, "Keyword token (also the ASYNC and AWAIT tokens).", nullptr,
              false),
      TL_NODE_OPS(CCompForNode, CNode, "Comprehension 'for' clause.", nullptr, false, exprClass),
      TL_NODE_OPS(CListmakerNode, CNode, "List display contents of the 2.7 grammar.", ListmakerRules, false,
                  exprClass),
      TL_NODE_OPS(CTrailer, CNode, "Trailer: call arguments, subscript or attribute.", nullptr, false,
                  exprClass),
      TL_NODE_OPS(CAtomExpr, CExpression, "atom_expr: [AWAIT] atom trailer*.", AtomExprRules, false,
                  exprClass),
      TL_NODE_OPS(CPower, CExpression, "power: atom with trailers and an optional exponent.", PowerRules,
                  true, exprClass),
      TL_NODE_OPS(CNumberLiteral, CExpression, "NUMBER token.", nullptr, false, exprClass),
      TL_NODE_OPS(CStringLiteral, CExpression, "STRING token.", nullptr, false, exprClass),
      TL_NODE_OPS(CFactorExpr, CExpression, "Unary '+', '-' or '~' applied to a factor.", nullptr, false,
                  exprClass),
      TL_NODE(CNamedExpr, CExpression, "Assignment expression: NAME ':=' test.", NamedExprRules, false),
      TL_NODE(CCaseBlock, CNode, "case clause of a match statement: 'case' patterns [guard] ':' suite.",
              CaseBlockRules, false),
      TL_NODE(CPattern, CNode,
              "A pattern of a case clause other than a lone capture (a NAME): or-, as-, literal, value, "
              "class, group, sequence, star and mapping patterns and their parts.",
              PatternRules, false),
      TL_NODE(CTypeParams, CNode, "Type parameter list of a def or class: '[' type_param, ... ']'.",
              TypeParamsRules, false),
      TL_NODE(CTypeAliasStmt, CStmt, "type statement: 'type' NAME [type_params] '=' test.", TypeAliasRules,
              false),
  };
  return Rows;
}

} // namespace treelens
