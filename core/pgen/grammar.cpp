// Validation and compilation of pgen grammars into flat tables.
#include "grammar.h"

#include <cstring>

namespace pgen {

namespace {

/// Symbol numbers above this are refused, to bound the symbol index table.
constexpr long MaxSymbol = FirstSymbol + (1 << 20);
/// Labels, states and arcs are counted in 32 bits with room to spare.
constexpr size_t MaxCount = 1u << 30;
/// Bound of the move table and pool, in entries.
constexpr size_t MaxMoves = size_t(1) << 26;
/// Pushes one precomputed move makes at most.
constexpr uint32_t MaxChain = 64;

uint32_t hashText(const char *Text, size_t Len) {
  uint32_t H = 2166136261u;
  for (size_t I = 0; I < Len; ++I)
    H = (H ^ static_cast<unsigned char>(Text[I])) * 16777619u;
  return H;
}

std::string describe(const char *What, long N) {
  return std::string(What) + " " + std::to_string(N);
}

} // namespace

std::unique_ptr<Grammar> Grammar::compile(const GrammarSource &Src,
                                          std::string &Error) {
  std::unique_ptr<Grammar> G(new Grammar());
  size_t NumLabels = Src.Labels.size();
  if (NumLabels == 0 || NumLabels > MaxCount) {
    Error = "grammar has no labels";
    return nullptr;
  }
  G->LabelCount = NumLabels;

  // Symbol number -> DFA index.
  long MaxSym = FirstSymbol - 1;
  for (const auto &D : Src.Dfas) {
    if (D.Symbol < FirstSymbol || D.Symbol > MaxSymbol) {
      Error = describe("symbol number out of range:", D.Symbol);
      return nullptr;
    }
    if (D.Symbol > MaxSym)
      MaxSym = D.Symbol;
  }
  G->SymbolDfas.assign(static_cast<size_t>(MaxSym - FirstSymbol + 1), -1);
  for (size_t I = 0; I < Src.Dfas.size(); ++I) {
    int32_t &Slot = G->SymbolDfas[Src.Dfas[I].Symbol - FirstSymbol];
    if (Slot != -1) {
      Error = describe("duplicate symbol", Src.Dfas[I].Symbol);
      return nullptr;
    }
    Slot = static_cast<int32_t>(I);
  }

  for (size_t L = 0; L < NumLabels; ++L) {
    int T = Src.Labels[L];
    if (T < 0 || (T >= FirstSymbol && G->dfaOfSymbol(T) < 0)) {
      Error = describe("label has an unknown type:", static_cast<long>(L));
      return nullptr;
    }
  }
  auto tokenLabel = [&](int L) {
    return L >= 0 && static_cast<size_t>(L) < NumLabels &&
           Src.Labels[L] < FirstSymbol;
  };

  size_t Words = (NumLabels + 63) / 64;
  for (const auto &D : Src.Dfas) {
    if (D.States.empty()) {
      Error = describe("symbol has no states:", D.Symbol);
      return nullptr;
    }
    Dfa Out;
    Out.Symbol = D.Symbol;
    Out.FirstState = static_cast<uint32_t>(G->States.size());
    Out.NumStates = static_cast<uint32_t>(D.States.size());
    Out.FirstSet = static_cast<uint32_t>(G->FirstBits.size());
    G->FirstBits.resize(G->FirstBits.size() + Words, 0);
    for (int L : D.First) {
      if (L < 0 || static_cast<size_t>(L) >= NumLabels) {
        Error = describe("first set label out of range in symbol", D.Symbol);
        return nullptr;
      }
      G->FirstBits[Out.FirstSet + (L >> 6)] |= uint64_t(1) << (L & 63);
    }
    for (size_t S = 0; S < D.States.size(); ++S) {
      const auto &InArcs = D.States[S];
      State St;
      St.FirstArc = static_cast<uint32_t>(G->Arcs.size());
      St.NumArcs = static_cast<uint32_t>(InArcs.size());
      St.CanAccept = false;
      for (const auto &A : InArcs) {
        if (A.Label < 0 || static_cast<size_t>(A.Label) >= NumLabels ||
            A.Next < 0 || static_cast<size_t>(A.Next) >= D.States.size()) {
          Error = describe("arc out of range in symbol", D.Symbol);
          return nullptr;
        }
        int T = Src.Labels[A.Label];
        Arc Out2;
        Out2.Label = static_cast<uint32_t>(A.Label);
        Out2.Next = Out.FirstState + static_cast<uint32_t>(A.Next);
        Out2.Push = T >= FirstSymbol ? G->dfaOfSymbol(T) : -1;
        G->Arcs.push_back(Out2);
        if (A.Label == 0 && static_cast<size_t>(A.Next) == S)
          St.CanAccept = true;
      }
      St.AcceptOnly = InArcs.size() == 1 && St.CanAccept;
      G->States.push_back(St);
    }
    if (G->States.size() > MaxCount || G->Arcs.size() > MaxCount) {
      Error = "grammar is too large";
      return nullptr;
    }
    G->Dfas.push_back(Out);
  }

  if (!G->checkFirstSets(Src, Error))
    return nullptr;

  for (int &T : G->TokenLabels)
    T = -1;
  for (const auto &T : Src.Tokens) {
    if (T.first < 0 || T.first >= 256) {
      Error = describe("token type out of range:", T.first);
      return nullptr;
    }
    if (!tokenLabel(T.second)) {
      Error = describe("token has no token label:", T.first);
      return nullptr;
    }
    G->TokenLabels[T.first] = T.second;
  }

  if (!Src.Keywords.empty()) {
    size_t Cap = 8;
    while (Cap < Src.Keywords.size() * 2)
      Cap *= 2;
    G->KeywordSlots.assign(Cap, KeywordSlot{0, -1, 0, 0});
    for (const auto &K : Src.Keywords) {
      if (!tokenLabel(K.second)) {
        Error = "keyword has no token label: " + K.first;
        return nullptr;
      }
      G->KeywordLengths |= uint64_t(1) << lengthBit(K.first.size());
      uint32_t H = hashText(K.first.data(), K.first.size());
      size_t I = H & (Cap - 1);
      while (G->KeywordSlots[I].Label >= 0) {
        const KeywordSlot &Old = G->KeywordSlots[I];
        if (Old.Hash == H && Old.Len == K.first.size() &&
            G->KeywordText.compare(Old.Offset, Old.Len, K.first) == 0)
          break; // a repeated keyword: the later entry wins, as in a dict
        I = (I + 1) & (Cap - 1);
      }
      KeywordSlot &Slot = G->KeywordSlots[I];
      if (Slot.Label < 0) {
        Slot.Hash = H;
        Slot.Offset = static_cast<uint32_t>(G->KeywordText.size());
        Slot.Len = static_cast<uint32_t>(K.first.size());
        G->KeywordText += K.first;
      }
      Slot.Label = K.second;
    }
  }

  // Terminals and their moves.
  G->Terminals.assign(NumLabels, 0);
  std::vector<uint32_t> TerminalLabels;
  for (size_t L = 0; L < NumLabels; ++L)
    if (Src.Labels[L] < FirstSymbol) {
      G->Terminals[L] = static_cast<uint32_t>(TerminalLabels.size());
      TerminalLabels.push_back(static_cast<uint32_t>(L));
    }
  G->TerminalCount = TerminalLabels.size();
  if (G->States.size() * G->TerminalCount > MaxMoves) {
    Error = "grammar is too large";
    return nullptr;
  }
  G->AcceptOnlyStates.resize(G->States.size());
  for (size_t S = 0; S < G->States.size(); ++S)
    G->AcceptOnlyStates[S] = G->States[S].AcceptOnly;
  G->Pool.assign(MoveFirst, 0);
  MoveIndex Index;
  G->Moves.assign(G->States.size() * G->TerminalCount, MoveError);
  for (size_t S = 0; S < G->States.size(); ++S) {
    for (size_t T = 0; T < G->TerminalCount; ++T)
      G->Moves[S * G->TerminalCount + T] =
          G->buildMove(static_cast<uint32_t>(S), TerminalLabels[T], Index);
    if (G->Pool.size() > MaxMoves) {
      Error = "grammar is too large";
      return nullptr;
    }
  }

  if (G->Pool.size() <= UINT16_MAX) {
    G->NarrowMoves.assign(G->Moves.begin(), G->Moves.end());
    std::vector<uint32_t>().swap(G->Moves);
  }

  if (G->dfaOfSymbol(Src.Start) < 0) {
    Error = describe("start symbol has no DFA:", Src.Start);
    return nullptr;
  }
  G->Start = Src.Start;
  return G;
}

// FIRST(D) = the token labels of the arcs out of D's first state, plus
// FIRST(X) of each symbol X such an arc pushes (label 0, the accept marker,
// left out on both sides). The driver relies on the declared sets: a symbol
// pushed for a token it cannot take pops again without consuming it.
bool Grammar::checkFirstSets(const GrammarSource &Src, std::string &Error) const {
  const size_t Words = (LabelCount + 63) / 64;
  std::vector<uint64_t> Computed(Dfas.size() * Words, 0);
  enum : uint8_t { Unseen, Open, Closed };
  std::vector<uint8_t> Mark(Dfas.size(), Unseen);
  // Depth-first over pushes, with an explicit stack: (DFA, next arc).
  std::vector<std::pair<uint32_t, uint32_t>> Stack;
  for (uint32_t Root = 0; Root < Dfas.size(); ++Root) {
    if (Mark[Root] != Unseen)
      continue;
    Mark[Root] = Open;
    Stack.emplace_back(Root, 0);
    while (!Stack.empty()) {
      const uint32_t D = Stack.back().first;
      const State &St = States[Dfas[D].FirstState];
      uint32_t &K = Stack.back().second;
      if (K == St.NumArcs) {
        Mark[D] = Closed;
        Stack.pop_back();
        if (!Stack.empty()) {
          const uint32_t Parent = Stack.back().first;
          for (size_t W = 0; W < Words; ++W)
            Computed[Parent * Words + W] |= Computed[D * Words + W];
          ++Stack.back().second;
        }
        continue;
      }
      const Arc &A = Arcs[St.FirstArc + K];
      if (A.Push < 0) {
        if (A.Label != 0)
          Computed[D * Words + (A.Label >> 6)] |= uint64_t(1) << (A.Label & 63);
        ++K;
        continue;
      }
      const uint32_t X = static_cast<uint32_t>(A.Push);
      if (Mark[X] == Open) {
        Error = "left-recursive symbol " + std::to_string(Dfas[X].Symbol);
        return false;
      }
      if (Mark[X] == Closed) {
        for (size_t W = 0; W < Words; ++W)
          Computed[D * Words + W] |= Computed[X * Words + W];
        ++K;
        continue;
      }
      Mark[X] = Open;
      Stack.emplace_back(X, 0);
    }
  }
  for (size_t D = 0; D < Dfas.size(); ++D)
    for (size_t W = 0; W < Words; ++W) {
      uint64_t Mask = W == 0 ? ~uint64_t(1) : ~uint64_t(0);
      if ((Computed[D * Words + W] ^ FirstBits[Dfas[D].FirstSet + W]) & Mask) {
        Error = "first set disagrees with the arcs of symbol " + std::to_string(Src.Dfas[D].Symbol);
        return false;
      }
    }
  return true;
}

const Grammar::Arc *Grammar::firstArc(uint32_t S, uint32_t L) const {
  const State &St = States[S];
  for (uint32_t A = St.FirstArc; A < St.FirstArc + St.NumArcs; ++A) {
    const Arc &Ar = Arcs[A];
    if (Ar.Label == L || (Ar.Push >= 0 && inFirst(Dfas[Ar.Push], L)))
      return &Ar;
  }
  return nullptr;
}

uint32_t Grammar::buildMove(uint32_t S, uint32_t L, MoveIndex &Index) {
  const Arc *A = firstArc(S, L);
  if (!A)
    return States[S].CanAccept ? MovePop : MoveError;
  uint32_t M = static_cast<uint32_t>(Pool.size());
  Pool.push_back(0);
  uint32_t Pushes = 0;
  uint32_t Header = 0;
  for (;;) {
    if (A->Label == L) {
      Pool.push_back(A->Next);
      Header = MoveShifts;
      break;
    }
    const Dfa &D = Dfas[A->Push];
    Pool.push_back(A->Next);
    Pool.push_back(static_cast<uint32_t>(D.Symbol));
    ++Pushes;
    // Stop at a symbol that does not take L at once (possible only with
    // first sets that disagree with the arcs) or at a long chain; the
    // driver goes on from the pushed symbol's first state.
    A = Pushes < MaxChain ? firstArc(D.FirstState, L) : nullptr;
    if (!A) {
      Pool.push_back(D.FirstState);
      break;
    }
  }
  Pool[M] = Header | Pushes;
  // Moves of states that share their arcs repeat: keep one copy.
  std::vector<uint32_t> Key(Pool.begin() + M, Pool.end());
  auto Found = Index.emplace(std::move(Key), M);
  if (!Found.second) {
    Pool.resize(M);
    return Found.first->second;
  }
  return M;
}

size_t Grammar::tableBytes() const {
  return sizeof(*this) + Arcs.size() * sizeof(Arc) +
         States.size() * sizeof(State) + Dfas.size() * sizeof(Dfa) +
         FirstBits.size() * 8 + SymbolDfas.size() * 4 + Terminals.size() * 4 +
         Moves.size() * 4 + NarrowMoves.size() * 2 + Pool.size() * 4 +
         AcceptOnlyStates.size() + KeywordSlots.size() * sizeof(KeywordSlot) + KeywordText.size();
}

int Grammar::keywordLabel(const char *Text, size_t Len) const {
  uint32_t H = hashText(Text, Len);
  size_t Mask = KeywordSlots.size() - 1;
  for (size_t I = H & Mask;; I = (I + 1) & Mask) {
    const KeywordSlot &S = KeywordSlots[I];
    if (S.Label < 0)
      return -1;
    if (S.Hash == H && S.Len == Len &&
        std::memcmp(KeywordText.data() + S.Offset, Text, Len) == 0)
      return S.Label;
  }
}

} // namespace pgen
