// Tests of the byte tokenizer and the logical-line splitter.
#include "tokenize/splitter.h"
#include "tokenize/tokenizer.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

using namespace tokcore;

namespace {

int typeOf(const std::string &S) { return static_cast<int>(classifyText(S.data(), S.size())); }

/// Texts and types of all tokens of Src, as the lexer scans them.
std::vector<std::pair<std::string, int>> lex(const std::string &Src) {
  std::vector<std::pair<std::string, int>> Out;
  Lexer L(Src.data(), Src.size(), bomLength(Src.data(), Src.size()));
  while (!L.atEnd()) {
    L.skipBlanks();
    if (L.atLineEnd()) {
      L.consumeLineEnd();
      continue;
    }
    Token T;
    L.scan(T);
    Out.emplace_back(Src.substr(T.Start, T.End - T.Start), static_cast<int>(T.Type));
  }
  return Out;
}

SplitResult split(const std::string &Src) {
  SplitResult R;
  EXPECT_EQ(splitLogicals(Src.data(), Src.size(), R), TokStatus::OK);
  return R;
}

std::string lineText(const std::string &Src, const SplitLogical &G) {
  return Src.substr(G.TextStart, G.TextEnd - G.TextStart);
}

/// The concatenation invariant and token placement, checked on any split.
void checkInvariants(const std::string &Src, const SplitResult &R) {
  size_t Pos = bomLength(Src.data(), Src.size());
  for (const SplitLogical &G : R.Logicals) {
    ASSERT_EQ(G.TextStart, Pos);
    ASSERT_LE(G.TextStart, G.TextEnd);
    Pos = G.TextEnd;
    for (size_t I = 0; I < G.TokenCount; ++I) {
      const SplitToken &T = R.Tokens[G.FirstToken + I];
      ASSERT_GE(T.Start, G.TextStart);
      ASSERT_LE(T.End, G.TextEnd);
      ASSERT_LT(T.Start, T.End);
    }
    ASSERT_LT(G.Parent, static_cast<long>(&G - R.Logicals.data()));
  }
  ASSERT_EQ(Pos, Src.size());
}

TEST(ClassifyText, TypesByFirstBytes) {
  struct Case {
    const char *Text;
    int Type;
  } Cases[] = {
      {"", 0},         {"\n", 4},         {"\r\n", 4},      {"x", 1},         {"print", 1},
      {"async", 1},    {"await", 1},      {"_a1", 1},       {"\xc3\xa9t\xc3\xa9", 1},
      {"br", 1},       {"ub'x'", 1},      {"0777L", 2},     {"0b1", 2},       {"0o7", 2},
      {"0x1F", 2},     {"1_000", 2},      {"1e-5", 2},      {"1j", 2},        {".5", 2},
      {"1.", 2},       {"'a'", 3},        {"\"\"\"x", 3},   {"b'x'", 3},      {"R'x'", 3},
      {"u'x'", 3},     {"f'{x}'", 3},     {"Br'x'", 3},     {"rB'x'", 3},     {"fR'x'", 3},
      {"Rf'x'", 3},    {"uR'x'", 3},      {"(", 7},         {")", 8},         {"[", 9},
      {"]", 10},       {":", 11},         {",", 12},        {";", 13},        {"+", 14},
      {"-", 15},       {"*", 16},         {"/", 17},        {"|", 18},        {"&", 19},
      {"<", 20},       {">", 21},         {"=", 22},        {".", 23},        {"%", 24},
      {"`", 25},       {"{", 26},         {"}", 27},        {"==", 28},       {"!=", 29},
      {"<>", 29},      {"<=", 30},        {">=", 31},       {"~", 32},        {"^", 33},
      {"<<", 34},      {">>", 35},        {"**", 36},       {"+=", 37},       {"-=", 38},
      {"*=", 39},      {"/=", 40},        {"%=", 41},       {"&=", 42},       {"|=", 43},
      {"^=", 44},      {"<<=", 45},       {">>=", 46},      {"**=", 47},      {"//", 48},
      {"//=", 49},     {"@", 50},         {"@=", 56},       {"->", 51},       {"...", 52},
      {":=", 55},
      {"$", 201},      {"?", 201},        {"!", 201},       {" ", 201},
      {"# c", 202},    {"\\", 203},
  };
  for (const Case &C : Cases)
    EXPECT_EQ(typeOf(C.Text), C.Type) << "text: " << C.Text;
  // Near misses.
  EXPECT_EQ(typeOf(".."), 23);
  EXPECT_EQ(typeOf("bu'x'"), 1);
  EXPECT_EQ(typeOf("rr'x'"), 1);
  EXPECT_EQ(typeOf("f"), 1);
}

TEST(Lexer, SplitsTokensAsPythonDoes) {
  struct Case {
    const char *Src;
    std::vector<std::pair<std::string, int>> Tokens;
  } Cases[] = {
      {"a<>b!=c", {{"a", 1}, {"<>", 29}, {"b", 1}, {"!=", 29}, {"c", 1}}},
      {"x[...]", {{"x", 1}, {"[", 9}, {"...", 52}, {"]", 10}}},
      {"(y:=f(x))[1:=2]", {{"(", 7}, {"y", 1}, {":=", 55}, {"f", 1}, {"(", 7}, {"x", 1}, {")", 8}, {")", 8},
                           {"[", 9}, {"1", 2}, {":=", 55}, {"2", 2}, {"]", 10}}},
      {"x: =1", {{"x", 1}, {":", 11}, {"=", 22}, {"1", 2}}},
      {"def f()->int:", {{"def", 1}, {"f", 1}, {"(", 7}, {")", 8}, {"->", 51}, {"int", 1}, {":", 11}}},
      {"1if x else 2", {{"1", 2}, {"if", 1}, {"x", 1}, {"else", 1}, {"2", 2}}},
      {"1else", {{"1", 2}, {"else", 1}}},
      {"1.e5j 0xffL 1.__class__", {{"1.e5j", 2}, {"0xffL", 2}, {"1.", 2}, {"__class__", 1}}},
      {"a.b .5", {{"a", 1}, {".", 23}, {"b", 1}, {".5", 2}}},
      {"f'{x!r}' rb\"\\\"\"", {{"f'{x!r}'", 3}, {"rb\"\\\"\"", 3}}},
      {"x = 'abc\ny", {{"x", 1}, {"=", 22}, {"'abc", 3}, {"y", 1}}},
      {"'a\\\nb'", {{"'a\\\nb'", 3}}},
      {"'''a\n'b'\n", {{"'''a\n'b'\n", 3}}},
      {"x $ ? ! \\ y", {{"x", 1}, {"$", 201}, {"?", 201}, {"!", 201}, {"\\", 201}, {"y", 1}}},
      {"x \\\ny", {{"x", 1}, {"\\", 203}, {"y", 1}}},
      {"a # c\r\nb", {{"a", 1}, {"# c", 202}, {"b", 1}}},
      {"\xef\xbb\xbfx", {{"x", 1}}},
      {"a\vb", {{"a", 1}, {"\v", 201}, {"b", 1}}},
      {"print >>f, `x`", {{"print", 1}, {">>", 35}, {"f", 1}, {",", 12}, {"`", 25}, {"x", 1}, {"`", 25}}},
  };
  for (const Case &C : Cases) {
    EXPECT_EQ(lex(C.Src), C.Tokens) << "source: " << C.Src;
  }
  // Embedded NUL needs an explicit length.
  std::string Nul("a\0b", 3);
  EXPECT_EQ(lex(Nul), (std::vector<std::pair<std::string, int>>{{"a", 1}, {std::string("\0", 1), 201}, {"b", 1}}));
}

TEST(FindStringEnd, StopsWhereTheLiteralEnds) {
  struct Case {
    const char *Src;
    size_t Quote;
    size_t End;
  } Cases[] = {
      {"'abc' x", 0, 5},  {"'a\\'b' x", 0, 6}, {"\"\"\"a\"b\"\"\" x", 0, 9},
      {"'abc\nx'", 0, 4}, {"'''abc", 0, 6},    {"f'{a['k']}'", 1, 6},
      {"'a\\", 0, 3},     {"''", 0, 2},         {"''''''", 0, 6},
  };
  for (const Case &C : Cases) {
    std::string S = C.Src;
    EXPECT_EQ(findStringEnd(S.data(), S.size(), C.Quote), C.End) << "source: " << C.Src;
  }
}

TEST(Split, BoundariesAndKinds) {
  std::string Src = "import os\n"
                    "\n"
                    "# note\n"
                    "@dec\n"
                    "class A(B,\n"
                    "        C):\n"
                    "    def f(self): return '''x\n"
                    "y'''\n"
                    "    async def g(): pass\n"
                    "    try: x = 1 + \\\n"
                    "        2\n"
                    "    except: pass\n";
  SplitResult R = split(Src);
  checkInvariants(Src, R);
  struct Expect {
    int Kind;
    long FirstLine;
    long Indent;
    long Parent;
  } Want[] = {{0, 0, 0, -1},  {22, 1, 0, -1}, {21, 2, 0, -1}, {0, 3, 0, -1}, {1, 4, 0, -1},
              {2, 6, 4, 4},   {2, 8, 4, 4},   {11, 9, 4, 4},  {0, 11, 4, 4}};
  ASSERT_EQ(R.Logicals.size(), sizeof(Want) / sizeof(Want[0]));
  for (size_t I = 0; I < R.Logicals.size(); ++I) {
    const SplitLogical &G = R.Logicals[I];
    EXPECT_EQ(G.Kind, Want[I].Kind) << "logical " << I;
    EXPECT_EQ(G.FirstLine, Want[I].FirstLine) << "logical " << I;
    EXPECT_EQ(G.Indent, Want[I].Indent) << "logical " << I;
    EXPECT_EQ(G.Parent, Want[I].Parent) << "logical " << I;
  }
  // The token after a multi-line string sits on the string's last line.
  const SplitLogical &F = R.Logicals[5];
  const SplitToken &Last = R.Tokens[F.FirstToken + F.TokenCount - 1];
  EXPECT_EQ(Src.substr(Last.Start, Last.End - Last.Start), "'''x\ny'''");
  EXPECT_EQ(Last.Row, 0);
  EXPECT_EQ(Last.Col, 24);
  const SplitLogical &T = R.Logicals[7];
  const SplitToken &Two = R.Tokens[T.FirstToken + T.TokenCount - 1];
  EXPECT_EQ(Two.Row, 1);
  EXPECT_EQ(Two.Col, 8);
}

TEST(Split, LineEndsAndBlankForms) {
  std::string Src = "a = 1\r\nb = (2,\r3)\rc\n\t\f \n  # x\r\n";
  SplitResult R = split(Src);
  checkInvariants(Src, R);
  ASSERT_EQ(R.Logicals.size(), 5u);
  EXPECT_EQ(lineText(Src, R.Logicals[0]), "a = 1\r\n");
  EXPECT_EQ(lineText(Src, R.Logicals[1]), "b = (2,\r3)\r");
  EXPECT_EQ(R.Logicals[2].FirstLine, 3);
  EXPECT_EQ(R.Logicals[3].Kind, kKindBlank);
  EXPECT_EQ(R.Logicals[4].Kind, kKindComment);
  EXPECT_EQ(R.Logicals[4].Indent, 2);
  // Near miss: a trailing backslash not at the line end does not continue.
  R = split("x = 1 \\ \ny\n");
  ASSERT_EQ(R.Logicals.size(), 2u);
}

TEST(Split, IndentColumnsExpandTabsAndResetOnFormFeed) {
  size_t After;
  EXPECT_EQ(indentColumn("\tx", 2, 0, &After), 8);
  EXPECT_EQ(indentColumn("  \tx", 4, 0, &After), 8);
  EXPECT_EQ(indentColumn("  \f x", 5, 0, &After), 1);
  EXPECT_EQ(After, 4u);
}

TEST(Split, CommentAndBlankParents) {
  std::string Src = "class A:\n"
                    "    def f(self):\n"
                    "        x = 1\n"
                    "# dedented, still in f\n"
                    "\n"
                    "        y = 2\n"
                    "        # end of f\n"
                    "\n"
                    "    # between methods\n"
                    "    def g(self): pass\n"
                    "# top\n"
                    "z = 3\n";
  SplitResult R = split(Src);
  checkInvariants(Src, R);
  long Want[] = {-1, 0, 1, 1, 1, 1, 1, 0, 0, 0, -1, -1};
  ASSERT_EQ(R.Logicals.size(), sizeof(Want) / sizeof(Want[0]));
  for (size_t I = 0; I < R.Logicals.size(); ++I)
    EXPECT_EQ(R.Logicals[I].Parent, Want[I]) << "logical " << I;
}

TEST(Split, UnclosedBracketStopsAtStatementKeyword) {
  std::string Src = "x = foo(1,\n"
                    "def g():\n"
                    "    return [\n"
                    "        1, 2,\n"
                    "class C: pass\n"
                    "y = (a\n"
                    "     if b\n"
                    "     else c,\n"
                    "     return_value)\n";
  SplitResult R = split(Src);
  checkInvariants(Src, R);
  ASSERT_EQ(R.Logicals.size(), 5u);
  EXPECT_EQ(R.Logicals[1].Kind, kKindDef);
  EXPECT_EQ(R.Logicals[2].Parent, 1);
  EXPECT_EQ(R.Logicals[3].Kind, kKindClass);
  EXPECT_EQ(R.Logicals[3].Parent, -1);
  // Near miss: `if`/`else` and names that merely start with a keyword continue.
  EXPECT_EQ(R.Logicals[4].FirstLine, 5);
  EXPECT_EQ(R.Logicals[4].TextEnd, Src.size());
}

TEST(Split, UnterminatedTripleStringRunsToTheEnd) {
  std::string Src = "x = '''abc\ndef f():\n    pass\n";
  SplitResult R = split(Src);
  checkInvariants(Src, R);
  ASSERT_EQ(R.Logicals.size(), 1u);
  ASSERT_EQ(R.Logicals[0].TokenCount, 3u);
  EXPECT_EQ(R.Tokens[2].End, Src.size());
}

TEST(Split, HostileInputKeepsTheInvariant) {
  std::vector<std::string> Inputs = {
      "",
      "\xef\xbb\xbf",
      "x",
      "\r",
      "\r\r\n\n\r",
      std::string(1 << 20, 'a'),
      std::string(10000, '(') + "\n" + std::string(10000, ')'),
      std::string(10000, '[') + "\n",
      std::string("a\0b\n\0\n", 7),
      "\xff\xfe\x80 = 1\n",
      "'",
      "'''",
      "\\",
      "x = \\",
      "   ",
      "# c",
      "f(\n" + std::string(5000, '\n'),
  };
  std::string Deep;
  for (int I = 0; I < 3000; ++I)
    Deep += std::string(static_cast<size_t>(I), ' ') + "def f():\n";
  Inputs.push_back(Deep + "# c\n");
  for (const std::string &S : Inputs) {
    SplitResult R = split(S);
    checkInvariants(S, R);
  }
  SplitResult R = split(Deep);
  EXPECT_EQ(R.Logicals.back().Parent, 2998);
}

} // namespace
