// Tables and driver of the pgen engine on a small hand-made grammar.
#include "pgen/grammar.h"
#include "pgen/parser.h"

#include <gtest/gtest.h>

#include <cstring>
#include <functional>
#include <string>

namespace {

using pgen::Grammar;
using pgen::GrammarSource;
using pgen::Status;

// start: stmt* ENDMARKER
// stmt: NAME '=' expr NEWLINE | 'print' expr NEWLINE
// expr: term ('+' term)*
// term: NAME | NUMBER | '(' expr ')'
enum Sym { Start = 256, Stmt, Expr, Term };
enum Tok { ENDMARKER = 0, NAME = 1, NUMBER = 2, NEWLINE = 4, LPAR = 7,
           RPAR = 8, PLUS = 14, EQUAL = 22, ERRORTOKEN = 201 };
enum Label { LEmpty, LStmt, LEnd, LName, LEqual, LExpr, LNewline, LPrint,
             LTerm, LPlus, LNumber, LLpar, LRpar };

GrammarSource tinySource() {
  GrammarSource S;
  S.Labels = {0, Stmt, ENDMARKER, NAME, EQUAL, Expr, NEWLINE,
              NAME, Term, PLUS, NUMBER, LPAR, RPAR};
  S.Tokens = {{ENDMARKER, LEnd}, {NAME, LName},   {EQUAL, LEqual},
              {NEWLINE, LNewline}, {PLUS, LPlus}, {NUMBER, LNumber},
              {LPAR, LLpar},      {RPAR, LRpar}};
  S.Keywords = {{"print", LPrint}};
  S.Dfas = {
      {Start, {{{LStmt, 0}, {LEnd, 1}}, {{LEmpty, 1}}}, {LName, LPrint, LEnd}},
      {Stmt,
       {{{LName, 1}, {LPrint, 2}},
        {{LEqual, 2}},
        {{LExpr, 3}},
        {{LNewline, 4}},
        {{LEmpty, 4}}},
       {LName, LPrint}},
      {Expr, {{{LTerm, 1}}, {{LPlus, 0}, {LEmpty, 1}}}, {LName, LNumber, LLpar}},
      {Term,
       {{{LName, 1}, {LNumber, 1}, {LLpar, 2}},
        {{LEmpty, 1}},
        {{LExpr, 3}},
        {{LRpar, 1}}},
       {LName, LNumber, LLpar}},
  };
  S.Start = Start;
  return S;
}

const Grammar &tiny() {
  static std::unique_ptr<Grammar> G = [] {
    std::string Error;
    auto P = Grammar::compile(tinySource(), Error);
    EXPECT_TRUE(P) << Error;
    return P;
  }();
  return *G;
}

/// Records the callbacks as text; can refuse the N-th one.
struct TraceSink {
  std::string Trace;
  int FailAt = -1;
  int Calls = 0;
  bool note(const std::string &S) {
    Trace += S + " ";
    return Calls++ != FailAt;
  }
  bool push(int Symbol) { return note("(" + std::to_string(Symbol)); }
  bool shift() { return note("s"); }
  bool pop(int Symbol) { return note(std::to_string(Symbol) + ")"); }
};

struct Tk {
  int Type;
  const char *Text;
};

/// Feeds tokens; the status of the last one fed (stops at the first error).
Status feed(pgen::Parser<TraceSink> &P, std::initializer_list<Tk> Tokens) {
  Status S = Status::Ok;
  for (const Tk &T : Tokens) {
    S = P.addToken(T.Type, T.Text, T.Text ? std::strlen(T.Text) : 0);
    if (S != Status::Ok && S != Status::Done)
      break;
  }
  return S;
}

TEST(PgenGrammar, ClassifiesTokensAndKeywords) {
  const Grammar &G = tiny();
  EXPECT_EQ(LName, G.classify(NAME, "x", 1));
  EXPECT_EQ(LPrint, G.classify(NAME, "print", 5));
  EXPECT_EQ(LNumber, G.classify(NUMBER, "print", 5)); // keywords are NAMEs
  EXPECT_EQ(LName, G.classify(NAME, nullptr, 0));
  EXPECT_EQ(LEnd, G.classify(ENDMARKER, nullptr, 0));
  // Near misses.
  EXPECT_EQ(LName, G.classify(NAME, "printx", 6));
  EXPECT_EQ(LName, G.classify(NAME, "prin", 4));
  EXPECT_EQ(LName, G.classify(NAME, "print", 4));
  EXPECT_EQ(-1, G.classify(ERRORTOKEN, "$", 1));
  EXPECT_EQ(-1, G.classify(300, "x", 1));
  EXPECT_EQ(-1, G.classify(-1, "x", 1));
  EXPECT_EQ(-1, G.classify(Start, nullptr, 0));
}

TEST(PgenGrammar, ManyKeywordsHash) {
  GrammarSource S = tinySource();
  for (int I = 0; I < 300; ++I)
    S.Keywords.emplace_back("kw" + std::to_string(I), LPrint);
  S.Keywords.emplace_back("print", LName); // a repeated key: the last wins
  std::string Error;
  auto G = Grammar::compile(S, Error);
  ASSERT_TRUE(G) << Error;
  for (int I = 0; I < 300; ++I) {
    std::string K = "kw" + std::to_string(I);
    EXPECT_EQ(LPrint, G->classify(NAME, K.data(), K.size())) << K;
    std::string Miss = "kw" + std::to_string(I + 300);
    EXPECT_EQ(LName, G->classify(NAME, Miss.data(), Miss.size())) << Miss;
  }
  EXPECT_EQ(LName, G->classify(NAME, "print", 5));
}

TEST(PgenGrammar, KeywordsOfEveryLength) {
  // Names are hashed only at lengths some keyword has; lengths from 63 on
  // share one mark.
  GrammarSource S = tinySource();
  const std::string Long63(63, 'k'), Long70(70, 'k'), Long80(80, 'k');
  S.Keywords.emplace_back(Long70, LPrint);
  S.Keywords.emplace_back("", LPrint);
  std::string Error;
  auto G = Grammar::compile(S, Error);
  ASSERT_TRUE(G) << Error;
  const struct {
    std::string Text;
    int Label;
  } Cases[] = {{Long70, LPrint}, {Long63, LName}, {Long80, LName},
               {"", LPrint},     {"print", LPrint}, {"x", LName},
               {std::string(62, 'k'), LName}};
  for (const auto &C : Cases)
    EXPECT_EQ(C.Label, G->classify(NAME, C.Text.data(), C.Text.size()))
        << C.Text.size() << " bytes";
}

TEST(PgenGrammar, RejectsMalformedSources) {
  struct Case {
    const char *Name;
    std::function<void(GrammarSource &)> Break;
  };
  const Case Cases[] = {
      {"no labels", [](GrammarSource &S) { S.Labels.clear(); }},
      {"arc label", [](GrammarSource &S) { S.Dfas[0].States[0][0].Label = 99; }},
      {"arc target", [](GrammarSource &S) { S.Dfas[0].States[0][0].Next = 2; }},
      {"negative target", [](GrammarSource &S) { S.Dfas[2].States[1][0].Next = -1; }},
      {"first label", [](GrammarSource &S) { S.Dfas[1].First.push_back(13); }},
      {"label symbol", [](GrammarSource &S) { S.Labels.push_back(300); }},
      {"label type", [](GrammarSource &S) { S.Labels.push_back(-4); }},
      {"symbol", [](GrammarSource &S) { S.Dfas[3].Symbol = 12; }},
      {"duplicate", [](GrammarSource &S) { S.Dfas[3].Symbol = Expr; }},
      {"no states", [](GrammarSource &S) { S.Dfas[3].States.clear(); }},
      {"token type", [](GrammarSource &S) { S.Tokens.push_back({256, LName}); }},
      {"token label", [](GrammarSource &S) { S.Tokens.push_back({3, 40}); }},
      {"token to symbol", [](GrammarSource &S) { S.Tokens.push_back({3, LExpr}); }},
      {"keyword label", [](GrammarSource &S) { S.Keywords.push_back({"if", LTerm}); }},
      {"start", [](GrammarSource &S) { S.Start = 300; }},
      // First sets must be the ones the arcs give, or the driver would push
      // symbols that cannot take the token and loop.
      {"first set short", [](GrammarSource &S) { S.Dfas[1].First.pop_back(); }},
      {"first set long", [](GrammarSource &S) { S.Dfas[2].First.push_back(LPlus); }},
      {"left recursion", [](GrammarSource &S) { S.Dfas[3].States[0][0].Label = LExpr; }},
  };
  for (const Case &C : Cases) {
    GrammarSource S = tinySource();
    C.Break(S);
    std::string Error;
    EXPECT_FALSE(Grammar::compile(S, Error)) << C.Name;
    EXPECT_FALSE(Error.empty()) << C.Name;
  }
  std::string Error;
  EXPECT_TRUE(Grammar::compile(tinySource(), Error)) << Error;
}

TEST(PgenParser, ReportsPushShiftPop) {
  TraceSink Sink;
  pgen::Parser<TraceSink> P(tiny(), Sink);
  ASSERT_TRUE(P.setup(Start));
  EXPECT_EQ(Status::Done, feed(P, {{NAME, "x"}, {EQUAL, "="}, {NAME, "a"},
                                   {PLUS, "+"}, {NUMBER, "1"}, {NEWLINE, "\n"},
                                   {ENDMARKER, nullptr}}));
  EXPECT_EQ("(257 s s (258 (259 s 259) s (259 s 259) 258) s 257) s 256) ",
            Sink.Trace);
  EXPECT_EQ(0u, P.depth());
}

TEST(PgenParser, KeywordStatementAndNesting) {
  TraceSink Sink;
  pgen::Parser<TraceSink> P(tiny(), Sink);
  ASSERT_TRUE(P.setup(Start));
  EXPECT_EQ(Status::Ok, feed(P, {{NAME, "print"}, {LPAR, "("}, {NAME, "b"},
                                 {RPAR, ")"}, {NEWLINE, "\n"}}));
  EXPECT_EQ("(257 s (258 (259 s (258 (259 s 259) 258) s 259) 258) s 257) ",
            Sink.Trace);
  EXPECT_EQ(1u, P.depth());
}

TEST(PgenParser, ErrorsLatchUntilSetup) {
  TraceSink Sink;
  pgen::Parser<TraceSink> P(tiny(), Sink);
  EXPECT_EQ(Status::NotReady, feed(P, {{NAME, "x"}}));
  struct Case {
    const char *Name;
    int Start;
    std::initializer_list<Tk> Tokens;
    Status Expected;
  };
  const Case Cases[] = {
      {"name name", Start, {{NAME, "x"}, {NAME, "y"}}, Status::BadInput},
      {"keyword as target", Start, {{NAME, "print"}, {EQUAL, "="}}, Status::BadInput},
      {"unclosed", Start, {{NAME, "x"}, {EQUAL, "="}, {RPAR, ")"}}, Status::BadInput},
      {"error token", Start, {{NAME, "x"}, {ERRORTOKEN, "$"}}, Status::BadToken},
      {"unknown type", Start, {{999, "x"}}, Status::BadToken},
      {"after done", Start, {{ENDMARKER, nullptr}, {NAME, "x"}}, Status::TooMuchInput},
      {"after expr", Expr, {{NAME, "a"}, {PLUS, "+"}, {NAME, "b"}, {RPAR, ")"}},
       Status::TooMuchInput},
      {"term done", Term, {{NAME, "a"}}, Status::Done},
  };
  for (const Case &C : Cases) {
    ASSERT_TRUE(P.setup(C.Start)) << C.Name;
    EXPECT_EQ(C.Expected, feed(P, C.Tokens)) << C.Name;
    if (C.Expected != Status::Done) {
      EXPECT_EQ(Status::NotReady, feed(P, {{NAME, "x"}})) << C.Name;
    }
  }
  EXPECT_FALSE(P.setup(Stmt + 100));
  EXPECT_FALSE(P.setup(NAME));
  EXPECT_EQ(Status::NotReady, feed(P, {{NAME, "x"}}));
  ASSERT_TRUE(P.setup(Start));
  EXPECT_EQ(Status::Done, feed(P, {{ENDMARKER, nullptr}}));
}

TEST(PgenParser, NestingBound) {
  TraceSink Sink;
  pgen::Parser<TraceSink> P(tiny(), Sink);
  ASSERT_TRUE(P.setup(Start));
  ASSERT_EQ(Status::Ok, feed(P, {{NAME, "x"}, {EQUAL, "="}}));
  Status S = Status::Ok;
  int I = 0;
  for (; I < 100000 && S == Status::Ok; ++I)
    S = P.addToken(LPAR, "(", 1);
  EXPECT_EQ(Status::TooDeep, S);
  EXPECT_LE(P.depth(), P.MaxDepth);
  EXPECT_GT(P.depth() + 3, P.MaxDepth);
  EXPECT_LT(I, 1000);
  // Just under the bound parses.
  ASSERT_TRUE(P.setup(Expr));
  int Open = (P.MaxDepth - 2) / 2;
  for (int K = 0; K < Open; ++K)
    ASSERT_EQ(Status::Ok, P.addToken(LPAR, "(", 1)) << K;
  ASSERT_EQ(Status::Ok, P.addToken(NAME, "a", 1));
  for (int K = 0; K < Open; ++K)
    ASSERT_EQ(Status::Ok, P.addToken(RPAR, ")", 1)) << K;
}

TEST(PgenParser, SinkAbort) {
  for (int FailAt = 0; FailAt < 12; ++FailAt) {
    TraceSink Sink;
    Sink.FailAt = FailAt;
    pgen::Parser<TraceSink> P(tiny(), Sink);
    ASSERT_TRUE(P.setup(Start));
    EXPECT_EQ(Status::Aborted,
              feed(P, {{NAME, "x"}, {EQUAL, "="}, {NAME, "a"}, {NEWLINE, "\n"},
                       {ENDMARKER, nullptr}}))
        << FailAt;
    EXPECT_EQ(Status::NotReady, feed(P, {{NAME, "x"}})) << FailAt;
    Sink.FailAt = -1;
    ASSERT_TRUE(P.setup(Start));
    EXPECT_EQ(Status::Done, feed(P, {{ENDMARKER, nullptr}})) << FailAt;
  }
}

} // namespace
