// libFuzzer target: a grammar and a token stream from the input; compiling
// never crashes, and a parse over a compiled grammar keeps its stack sound and
// ends every token within the engine's bounds.
#include "pgen/grammar.h"
#include "pgen/parser.h"

#include <cstdlib>
#include <string>
#include <vector>

using namespace pgen;

namespace {

void check(bool Ok) {
  if (!Ok)
    std::abort();
}

/// Reads the input a byte at a time; zeros past its end.
struct Reader {
  const uint8_t *P, *End;
  uint8_t byte() { return P < End ? *P++ : 0; }
  bool atEnd() const { return P >= End; }
};

const int TokenTypes[] = {0, 1, 2, 3, 4, 7, 8, 11, 22, 51};
const char *const Keywords[] = {"if", "else", "pass"};

/// Sink that mirrors the driver's stack and checks the callbacks against it.
struct Sink {
  std::vector<int> Open;
  size_t Shifts = 0;
  bool push(int Symbol) {
    Open.push_back(Symbol);
    check(Open.size() <= MaxParseDepth);
    return true;
  }
  bool shift() {
    ++Shifts;
    return true;
  }
  bool pop(int Symbol) {
    check(!Open.empty() && Open.back() == Symbol);
    Open.pop_back();
    return true;
  }
};

// Layout: label count, labels (a byte each: token type or symbol index), DFA
// count, per DFA its states and arcs, whether first sets are derived from the
// arcs or read, the start symbol, then the tokens.
GrammarSource readGrammar(Reader &R) {
  GrammarSource S;
  const int NumDfas = 1 + R.byte() % 6;
  const int NumLabels = 1 + R.byte() % 24;
  S.Labels.push_back(0);
  for (int L = 1; L < NumLabels; ++L) {
    uint8_t B = R.byte();
    S.Labels.push_back(B & 0x80 ? FirstSymbol + (B & 0x7f) % NumDfas
                                : TokenTypes[B % (sizeof(TokenTypes) / sizeof(int))]);
  }
  for (int D = 0; D < NumDfas; ++D) {
    GrammarSource::Dfa Dfa;
    Dfa.Symbol = FirstSymbol + D;
    const int NumStates = 1 + R.byte() % 5;
    Dfa.States.resize(NumStates);
    for (auto &State : Dfa.States) {
      const int NumArcs = R.byte() % 4;
      for (int A = 0; A < NumArcs; ++A) {
        GrammarSource::Arc Arc;
        Arc.Label = R.byte() % NumLabels;
        Arc.Next = R.byte() % NumStates;
        State.push_back(Arc);
      }
    }
    S.Dfas.push_back(Dfa);
  }
  if (R.byte() & 1) {
    // First sets by fixpoint over the first states' arcs.
    bool Changed = true;
    for (int Round = 0; Changed && Round < 64; ++Round) {
      Changed = false;
      for (auto &Dfa : S.Dfas)
        for (const auto &Arc : Dfa.States[0]) {
          std::vector<int> Add;
          int T = S.Labels[Arc.Label];
          if (Arc.Label == 0)
            continue;
          if (T < FirstSymbol)
            Add.push_back(Arc.Label);
          else
            Add = S.Dfas[T - FirstSymbol].First;
          for (int L : Add) {
            bool Found = false;
            for (int F : Dfa.First)
              Found = Found || F == L;
            if (!Found) {
              Dfa.First.push_back(L);
              Changed = true;
            }
          }
        }
    }
  } else {
    for (auto &Dfa : S.Dfas)
      for (int N = R.byte() % 4; N > 0; --N)
        Dfa.First.push_back(R.byte() % NumLabels);
  }
  for (int L = 1; L < NumLabels; ++L) {
    if (S.Labels[L] >= FirstSymbol)
      continue;
    bool Keyword = S.Labels[L] == NameTokenType && (R.byte() & 1);
    if (Keyword)
      S.Keywords.emplace_back(Keywords[L % 3], L);
    else
      S.Tokens.emplace_back(S.Labels[L], L);
  }
  S.Start = FirstSymbol + R.byte() % NumDfas;
  return S;
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *Data, size_t Size) {
  Reader R{Data, Data + Size};
  GrammarSource Src = readGrammar(R);
  std::string Error;
  std::unique_ptr<Grammar> G = Grammar::compile(Src, Error);
  if (!G) {
    check(!Error.empty());
    return 0;
  }
  Sink S;
  Parser<Sink> P(*G, S);
  check(!P.setup(FirstSymbol - 1));
  check(P.setup(G->startSymbol()));
  S.Open.assign(1, G->startSymbol());
  for (int Tokens = 0; !R.atEnd() && Tokens < 4096; ++Tokens) {
    uint8_t B = R.byte();
    int Type = B & 0x80 ? static_cast<int>(B) * 3 - 400 : TokenTypes[B % (sizeof(TokenTypes) / sizeof(int))];
    const char *Text = (B & 0x40) ? Keywords[B % 3] : "x";
    size_t Before = S.Shifts;
    Status St = P.addToken(Type, Text, std::string(Text).size());
    check(P.depth() <= MaxParseDepth);
    if (St == Status::Ok || St == Status::Done) {
      check(S.Shifts == Before + 1);
      check(St == Status::Done ? P.depth() == 0 && S.Open.empty() : P.depth() == S.Open.size());
      continue;
    }
    check(St != Status::NotReady);
    // After an error the parser refuses input until the next setup().
    check(P.addToken(Type, Text, 1) == Status::NotReady);
    check(P.setup(G->startSymbol()));
    S.Open.assign(1, G->startSymbol());
  }
  return 0;
}
