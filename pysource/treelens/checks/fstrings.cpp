// The replacement fields of an f-string as CPython 3.6 to 3.8 scan them
// before compiling each expression: the scan's own errors, and the
// expressions in the order they are compiled (a field's expression before its
// conversion and format specification, whose nested fields follow).
#include "pysource/treelens/checks/fstrings.h"

namespace treelens {
namespace checks {

namespace {

/// Fields nest one level deep: a field in a field's format specification.
constexpr int kMaxFieldNesting = 2;
/// 3.8's bound on open brackets in one expression.
constexpr int kMaxBrackets = 200;

class Scanner {
public:
  Scanner(const char *S, Py_ssize_t End, bool Raw, bool Py38, bool Py312, FieldScan &Out)
      : S(S), End(End), Raw(Raw), Py38(Py38), Py312(Py312), Out(Out) {}

  /// The literal text and fields up to the end of the string (level 0) or
  /// of a format specification (the '}' that closes its field).
  bool fields(Py_ssize_t &P, int Level) {
    for (;;) {
      int R = literal(P, Level);
      if (R < 0)
        return false;
      if (R == 1)
        continue;
      if (P >= End || S[P] == '}')
        break;
      if (!field(P, Level))
        return false;
    }
    if (Level != 0 && (P >= End || S[P] != '}'))
      return fail("f-string: expecting '}'");
    return true;
  }

private:
  const char *S;
  Py_ssize_t End;
  bool Raw, Py38;
  bool Py312; ///< 3.12's fields: one more level of nesting, backslashes allowed
  FieldScan &Out;

  bool fail(std::string Msg) {
    Out.Failed = true;
    Out.Error = std::move(Msg);
    Out.ErrorAfter = Out.Exprs.size();
    return false;
  }

  /// Literal text up to a '{' or '}': 1 after a doubled brace (scanning goes
  /// on), 0 at a single brace or the end, -1 on an error.
  int literal(Py_ssize_t &P, int Level) {
    Py_ssize_t I = P;
    while (I < End) {
      char C = S[I++];
      if (!Raw && C == '\\' && I < End) {
        C = S[I++];
        if (C == 'N') {
          // "\N{NAME}" names a character; a malformed one is a decoding error, not judged here.
          if (I < End && S[I++] == '{') {
            while (I < End && S[I++] != '}') {
            }
            continue;
          }
          fail("");
          return -1;
        }
      }
      if (C == '{' || C == '}') {
        // Doubled braces are text only at the top level: f'{a:{b}}' ends two fields.
        if (Level == 0) {
          if (I < End && S[I] == C) {
            P = I + 1;
            return 1;
          }
          if (C == '}') {
            fail("f-string: single '}' is not allowed");
            return -1;
          }
        }
        --I;
        break;
      }
    }
    P = I;
    return 0;
  }

  static bool blank(char C) { return C == ' ' || C == '\t' || C == '\n' || C == '\r' || C == '\f'; }

  /// One field, from its '{' past its '}'.
  bool field(Py_ssize_t &P, int Level) {
    if (Level >= kMaxFieldNesting + (Py312 ? 1 : 0))
      return fail("f-string: expressions nested too deeply");
    Py_ssize_t Begin = ++P;
    char Quote = 0;
    bool Triple = false;
    int Depth = 0;
    char Open[kMaxBrackets];
    for (; P < End; ++P) {
      char C = S[P];
      if (C == '\\' && !Py312)
        return fail("f-string expression part cannot include a backslash");
      if (Quote) {
        if (C == Quote) {
          if (!Triple) {
            Quote = 0;
          } else if (P + 2 < End && S[P + 1] == C && S[P + 2] == C) {
            P += 2;
            Quote = 0;
          }
        }
        continue;
      }
      if (C == '\'' || C == '"') {
        Triple = P + 2 < End && S[P + 1] == C && S[P + 2] == C;
        if (Triple)
          P += 2;
        Quote = C;
      } else if (C == '[' || C == '{' || C == '(') {
        if (Py38) {
          if (Depth >= kMaxBrackets)
            return fail("f-string: too many nested parenthesis");
          Open[Depth] = C;
        }
        ++Depth;
      } else if (!Py38 && Depth != 0 && (C == ']' || C == '}' || C == ')')) {
        --Depth;
      } else if (C == '#') {
        return fail("f-string expression part cannot include '#'");
      } else if (Depth == 0 && (C == '!' || C == ':' || C == '}' || (Py38 && (C == '=' || C == '<' || C == '>')))) {
        if (P + 1 < End) {
          // "!=" (and from 3.8 "==", "<=", ">=") belong to the expression, and so do lone '<' and '>'.
          char Next = S[P + 1];
          if (Next == '=' && (C == '!' || (Py38 && (C == '=' || C == '<' || C == '>')))) {
            P += Py38 ? 1 : 0;
            continue;
          }
          if (Py38 && (C == '<' || C == '>'))
            continue;
        }
        break;
      } else if (Py38 && (C == ']' || C == '}' || C == ')')) {
        if (!Depth)
          return fail(std::string("f-string: unmatched '") + C + "'");
        char O = Open[--Depth];
        if (!((O == '(' && C == ')') || (O == '[' && C == ']') || (O == '{' && C == '}')))
          return fail(std::string("f-string: closing parenthesis '") + C + "' does not match opening parenthesis '" +
                      O + "'");
      }
    }
    Py_ssize_t ExprEnd = P;
    if (Quote)
      return fail("f-string: unterminated string");
    if (Depth)
      return fail(Py38 ? std::string("f-string: unmatched '") + Open[Depth - 1] + "'"
                       : std::string("f-string: mismatched '(', '{', or '['"));
    if (P >= End)
      return fail("f-string: expecting '}'");
    Py_ssize_t I = Begin;
    while (I < ExprEnd && blank(S[I]))
      ++I;
    if (I == ExprEnd)
      return fail("f-string: empty expression not allowed");
    Out.Exprs.push_back({Begin, ExprEnd});
    if (Py38 && S[P] == '=') {
      // f'{x=}': the expression's text goes into the result.
      ++P;
      while (P < End && (blank(S[P]) || S[P] == '\v'))
        ++P;
    }
    if (P < End && S[P] == '!') {
      if (++P >= End)
        return fail("f-string: expecting '}'");
      char Conversion = S[P++];
      if (Conversion != 's' && Conversion != 'r' && Conversion != 'a')
        return fail("f-string: invalid conversion character: expected 's', 'r', or 'a'");
    }
    if (P >= End)
      return fail("f-string: expecting '}'");
    if (S[P] == ':') {
      if (++P >= End)
        return fail("f-string: expecting '}'");
      if (!fields(P, Level + 1))
        return false;
    }
    if (P >= End || S[P] != '}')
      return fail("f-string: expecting '}'");
    ++P;
    return true;
  }
};

} // namespace

void scanFString(const char *Tok, Py_ssize_t N, bool Py38, bool Py312, FieldScan &Out) {
  // Prefix letters, then one or three quotes on each side.
  Py_ssize_t P = 0;
  bool Raw = false;
  while (P < N && Tok[P] != '\'' && Tok[P] != '"') {
    Raw = Raw || Tok[P] == 'r' || Tok[P] == 'R';
    ++P;
  }
  if (P >= N)
    return;
  char Q = Tok[P];
  Py_ssize_t Quotes = P + 5 < N && Tok[P + 1] == Q && Tok[P + 2] == Q ? 3 : 1;
  Py_ssize_t Begin = P + Quotes, End = N - Quotes;
  if (End < Begin)
    return;
  Scanner Sc(Tok, End, Raw, Py38, Py312, Out);
  Sc.fields(Begin, 0);
}

} // namespace checks
} // namespace treelens
