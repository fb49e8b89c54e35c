// Checks CPython makes after parsing on case clauses' patterns and on type parameter lists, with
// its messages. Patterns are checked as CPython compiles them: sub-patterns left to right, each
// capture recorded once, an or-pattern's alternatives one after another.
#include "pysource/treelens/checks/newsyntax.h"

#include <string.h>

#include <algorithm>
#include <vector>

namespace treelens {
namespace checks {

namespace {

using N = NodeObject;

bool isLeaf(N *X) { return X->Children == nullptr; }
Py_ssize_t count(N *X) { return X->Children ? PyList_GET_SIZE(X->Children) : 0; }
N *child(N *X, Py_ssize_t I) { return reinterpret_cast<N *>(PyList_GET_ITEM(X->Children, I)); }
std::string text(N *X) {
  return X->Text && PyString_Check(X->Text) ? std::string(PyString_AS_STRING(X->Text), PyString_GET_SIZE(X->Text))
                                            : std::string();
}
bool textIs(N *X, const char *T) { return isLeaf(X) && text(X) == T; }

bool ruleIs(N *X, const char *Rule) {
  PyObject *Name = X->ClsInfo ? X->ClsInfo->Name : nullptr;
  return Name && PyString_Check(Name) && strcmp(PyString_AS_STRING(Name), Rule) == 0;
}

/// A NAME leaf that is no keyword (keywords have their own node class).
bool isNameLeaf(N *X) {
  return isLeaf(X) && X->ClsInfo && X->ClsInfo->NodeType == 1 &&
         Py_TYPE(X) != &nodeType(NodeClass::CKeywordLiteral);
}

/// The first capture-like NAME leaf of a subtree, or the subtree.
N *firstName(N *X) {
  if (isNameLeaf(X) || isLeaf(X))
    return X;
  for (Py_ssize_t I = 0; I < count(X); ++I) {
    N *Found = firstName(child(X, I));
    if (isNameLeaf(Found))
      return Found;
  }
  return X;
}

bool isImaginary(N *X) {
  std::string T = text(X);
  return !T.empty() && (T.back() == 'j' || T.back() == 'J');
}

/// Python's repr of a literal key, for the keys whose repr is their plain
/// text: decimal integers and quoted strings without prefix or escapes; else "".
std::string literalRepr(N *X) {
  if (!isLeaf(X))
    return std::string();
  std::string T = text(X);
  if (!T.empty() && std::all_of(T.begin(), T.end(), [](char C) { return C >= '0' && C <= '9'; }) &&
      (T.size() == 1 || T[0] != '0'))
    return T;
  if (T.size() >= 2 && (T[0] == '\'' || T[0] == '"') && T.back() == T[0] && T.compare(0, 3, "'''") != 0 &&
      T.compare(0, 3, "\"\"\"") != 0) {
    std::string Body = T.substr(1, T.size() - 2);
    if (Body.find_first_of("\\'\"") == std::string::npos)
      return "'" + Body + "'";
  }
  return std::string();
}

class PatternChecker {
public:
  PatternChecker(const ReportFn &Report, int Minor) : Report(Report), Minor(Minor) {}

  void pattern(N *X, bool Irrefutable) {
    if (isLeaf(X)) {
      if (isNameLeaf(X))
        capture(X, Irrefutable);
      return;
    }
    if (ruleIs(X, "pattern") && count(X) == 3) {
      // or_pattern 'as' NAME
      N *Name = child(X, 2);
      if (text(Name) == "_")
        Report(true, Name, "cannot use '_' as a target");
      pattern(child(X, 0), Irrefutable);
      store(Name);
    } else if (ruleIs(X, "or_pattern")) {
      orPattern(X, Irrefutable);
    } else if (ruleIs(X, "literal_pattern") || ruleIs(X, "signed_number")) {
      complexLiteral(X);
    } else if (ruleIs(X, "name_pattern")) {
      classPattern(X);
    } else if (ruleIs(X, "group_pattern") && count(X) == 3) {
      pattern(child(X, 1), Irrefutable);
    } else if (ruleIs(X, "group_pattern") || ruleIs(X, "sequence_pattern") || ruleIs(X, "patterns")) {
      sequence(X);
    } else if (ruleIs(X, "star_pattern")) {
      star(X);
    } else if (ruleIs(X, "mapping_pattern")) {
      mapping(X);
    }
  }

private:
  const ReportFn &Report;
  int Minor;
  std::vector<std::string> Names;

  void capture(N *Name, bool Irrefutable) {
    bool Wildcard = text(Name) == "_";
    if (!Irrefutable)
      Report(false, Name,
             Wildcard ? std::string("wildcard makes remaining patterns unreachable")
                      : "name capture '" + text(Name) + "' makes remaining patterns unreachable");
    if (!Wildcard)
      store(Name);
  }

  void store(N *Name) {
    std::string T = text(Name);
    if (T == "_")
      return;
    if (std::find(Names.begin(), Names.end(), T) != Names.end()) {
      Report(false, Name, "multiple assignments to name '" + T + "' in pattern");
      return;
    }
    Names.push_back(T);
  }

  void orPattern(N *X, bool Irrefutable) {
    std::vector<std::string> Saved = Names, FirstNew;
    for (Py_ssize_t I = 0; I < count(X); I += 2) {
      Names = Saved;
      pattern(child(X, I), Irrefutable && I + 1 >= count(X));
      std::vector<std::string> New(Names.begin() + static_cast<std::ptrdiff_t>(Saved.size()), Names.end());
      std::sort(New.begin(), New.end());
      if (I == 0)
        FirstNew = New;
      else if (New != FirstNew)
        Report(false, Minor >= 12 ? X : firstName(child(X, I)), "alternative patterns bind different names");
    }
    Names = Saved;
    Names.insert(Names.end(), FirstNew.begin(), FirstNew.end());
  }

  /// signed_number [('+' | '-') NUMBER]: the right part imaginary, the left real.
  void complexLiteral(N *X) {
    if (count(X) != 3 || !(textIs(child(X, 1), "+") || textIs(child(X, 1), "-")))
      return;
    N *Left = child(X, 0), *Right = child(X, 2);
    if (!isLeaf(Left))
      Left = child(Left, count(Left) - 1);
    if (!isImaginary(Right))
      Report(true, Right, "imaginary number required in complex literal");
    else if (isImaginary(Left))
      Report(true, Left, "real number required in complex literal");
  }

  /// NAME ('.' NAME)* ['(' [class_arg (',' class_arg)* [',']] ')']
  void classPattern(N *X) {
    Py_ssize_t Open = 0;
    while (Open < count(X) && !textIs(child(X, Open), "("))
      ++Open;
    if (Open >= count(X))
      return; // a value pattern
    std::vector<std::string> Keywords;
    bool SeenKeyword = false;
    for (Py_ssize_t I = Open + 1; I + 1 < count(X); I += 2) {
      N *Arg = child(X, I);
      if (ruleIs(Arg, "class_arg") && count(Arg) == 3) {
        N *Key = child(Arg, 0);
        if (!isNameLeaf(Key)) {
          Report(true, child(Arg, 1), "invalid syntax");
          return;
        }
        std::string K = text(Key);
        if (std::find(Keywords.begin(), Keywords.end(), K) != Keywords.end())
          Report(false, child(Arg, 2), "attribute name repeated in class pattern: " + K);
        Keywords.push_back(K);
        SeenKeyword = true;
        pattern(child(Arg, 2), true);
      } else {
        if (SeenKeyword)
          Report(true, Arg, "positional patterns follow keyword patterns");
        pattern(Arg, true);
      }
    }
  }

  void sequence(N *X) {
    int Stars = 0;
    for (Py_ssize_t I = 0; I < count(X); ++I)
      Stars += ruleIs(child(X, I), "star_pattern");
    if (Stars > 1) {
      Report(false, X, "multiple starred names in sequence pattern");
      return;
    }
    for (Py_ssize_t I = 0; I < count(X); ++I)
      if (!isLeaf(child(X, I)) || isNameLeaf(child(X, I)))
        pattern(child(X, I), true);
  }

  void star(N *X) { store(child(X, 1)); }

  /// '{' [mapping_item (',' mapping_item)* [',']] '}'; an item is key ':' pattern or '**' NAME.
  void mapping(N *X) {
    std::vector<std::string> Keys;
    N *Rest = nullptr;
    for (Py_ssize_t I = 1; I + 1 < count(X); I += 2) {
      N *Item = child(X, I);
      if (Rest) {
        // The rest comes last.
        Report(true, Item, "invalid syntax");
        return;
      }
      if (count(Item) == 2 && textIs(child(Item, 0), "**")) {
        Rest = child(Item, 1);
        if (text(Rest) == "_")
          Report(true, Rest, "invalid syntax");
        continue;
      }
      if (count(Item) != 3)
        continue;
      std::string Repr = literalRepr(child(Item, 0));
      if (!Repr.empty()) {
        if (std::find(Keys.begin(), Keys.end(), Repr) != Keys.end())
          Report(false, X, "mapping pattern checks duplicate key (" + Repr + ")");
        Keys.push_back(Repr);
      }
    }
    for (Py_ssize_t I = 1; I + 1 < count(X); I += 2) {
      N *Item = child(X, I);
      if (count(Item) == 3)
        pattern(child(Item, 2), true);
    }
    if (Rest)
      store(Rest);
  }
};

} // namespace

void checkPatterns(NodeObject *Patterns, int Minor, const ReportFn &Report) {
  PatternChecker(Report, Minor).pattern(Patterns, true);
}

void checkTypeParams(NodeObject *Params, int Minor, const ReportFn &Report) {
  // '[' type_param (',' type_param)* [','] ']'; a type_param is NAME, or
  // NAME ':' bound, '*' NAME, '**' NAME, each with '=' default from 3.13.
  std::vector<std::string> Names;
  bool SeenDefault = false;
  for (Py_ssize_t I = 1; I + 1 < count(Params); I += 2) {
    N *Param = child(Params, I);
    N *Name = Param;
    bool Default = false;
    if (!isLeaf(Param)) {
      Name = textIs(child(Param, 0), "*") || textIs(child(Param, 0), "**") ? child(Param, 1) : child(Param, 0);
      for (Py_ssize_t J = 0; J < count(Param); ++J)
        Default = Default || textIs(child(Param, J), "=");
    }
    std::string T = text(Name);
    if (Minor >= 13 && SeenDefault && !Default)
      Report(true, Name, "non-default type parameter '" + T + "' follows default type parameter");
    SeenDefault = SeenDefault || Default;
    if (std::find(Names.begin(), Names.end(), T) != Names.end())
      Report(false, Param, "duplicate type parameter '" + T + "'");
    Names.push_back(T);
  }
}

} // namespace checks
} // namespace treelens
