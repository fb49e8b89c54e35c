// Compiled LL(1) tables of a pgen grammar: flat arcs, first sets as bit sets
// and a hashed keyword table.
#ifndef TREELENS_PGEN_GRAMMAR_H
#define TREELENS_PGEN_GRAMMAR_H

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

namespace pgen {

/// Token type of identifiers and keywords; keywords are looked up only for it.
constexpr int NameTokenType = 1;
/// Symbols (nonterminals) are numbered from here.
constexpr int FirstSymbol = 256;

/// A grammar in the notation of a pgen grammar object, as plain data.
///
/// Labels are numbered by their position and given by their type: < 256 a
/// token or keyword, >= 256 a symbol. An arc with label 0 back to its own
/// state marks an accepting state.
struct GrammarSource {
  struct Arc {
    int Label = 0;
    int Next = 0;
  };
  struct Dfa {
    int Symbol = 0;
    std::vector<std::vector<Arc>> States;
    std::vector<int> First; ///< labels that can start the symbol
  };
  std::vector<int> Labels; ///< label -> type
  std::vector<Dfa> Dfas;
  std::vector<std::pair<std::string, int>> Keywords; ///< text -> label
  std::vector<std::pair<int, int>> Tokens;           ///< token type -> label
  int Start = 0;
};

/// Immutable parse tables compiled from a GrammarSource; shared by parsers.
///
/// The arcs and first sets are compiled into one move per (state, terminal):
/// the first arc of the state, in grammar order, that carries the terminal's
/// label or pushes a symbol whose first set holds it (the choice lib2to3's
/// parser makes by scanning the arcs), followed through every push it leads
/// to until the terminal is shifted.
class Grammar {
public:
  /// One transition. Push is the DFA index of a symbol label, else -1.
  struct Arc {
    uint32_t Label;
    uint32_t Next; ///< global state index
    int32_t Push;
  };
  /// Arcs of state S are Arcs[FirstArc, FirstArc + NumArcs), in grammar order.
  struct State {
    uint32_t FirstArc;
    uint32_t NumArcs;
    bool AcceptOnly; ///< the only arc is (0, this state)
    bool CanAccept;  ///< some arc is (0, this state)
  };
  /// States of a DFA are global indexes [FirstState, FirstState + NumStates).
  struct Dfa {
    int Symbol;
    uint32_t FirstState;
    uint32_t NumStates;
    uint32_t FirstSet; ///< offset of its first set in FirstBits
  };

  /// move() results below MoveFirst: no arc takes the terminal.
  static constexpr uint32_t MoveError = 0; ///< and the state cannot accept
  static constexpr uint32_t MovePop = 1;   ///< and the state accepts
  static constexpr uint32_t MoveFirst = 2;
  /// A move at offset M of the pool: moveHeader(M) holds the push count N
  /// and MoveShifts; then N pairs (state the frame below continues in,
  /// symbol pushed); then the state the top frame ends in.
  static constexpr uint32_t MoveShifts = 0x80000000u;

  /// Validates and compiles Source; null with a message in Error on failure.
  static std::unique_ptr<Grammar> compile(const GrammarSource &Source,
                                          std::string &Error);

  /// Label of a token, or -1 when the grammar has none for it.
  int classify(int Type, const char *Text, size_t Len) const {
    if (Type == NameTokenType && Text &&
        ((KeywordLengths >> lengthBit(Len)) & 1)) {
      int L = keywordLabel(Text, Len);
      if (L >= 0)
        return L;
    }
    if (Type < 0 || Type >= 256)
      return -1;
    return TokenLabels[Type];
  }

  /// Dense terminal index of a token label (type < 256).
  uint32_t terminalOf(uint32_t Label) const { return Terminals[Label]; }

  /// What state S does on terminal T: MoveError, MovePop or a pool offset.
  uint32_t move(uint32_t S, uint32_t T) const {
    size_t I = static_cast<size_t>(S) * TerminalCount + T;
    return NarrowMoves.empty() ? Moves[I] : NarrowMoves[I];
  }
  const uint32_t *movePool(uint32_t M) const { return &Pool[M]; }
  bool acceptOnly(uint32_t S) const { return AcceptOnlyStates[S] != 0; }

  /// DFA index of a symbol number, or -1.
  int dfaOfSymbol(int Symbol) const {
    size_t I = static_cast<size_t>(Symbol) - FirstSymbol;
    return Symbol >= FirstSymbol && I < SymbolDfas.size() ? SymbolDfas[I] : -1;
  }

  /// True when label L starts DFA D.
  bool inFirst(const Dfa &D, uint32_t L) const {
    return (FirstBits[D.FirstSet + (L >> 6)] >> (L & 63)) & 1;
  }

  int startSymbol() const { return Start; }
  /// Bytes held by the compiled tables.
  size_t tableBytes() const;
  size_t labelCount() const { return LabelCount; }
  const Dfa &dfa(size_t I) const { return Dfas[I]; }
  const State &state(size_t I) const { return States[I]; }
  const Arc &arc(size_t I) const { return Arcs[I]; }

private:
  Grammar() = default;
  int keywordLabel(const char *Text, size_t Len) const;
  /// False, with a message, when a declared first set differs from the one
  /// the arcs give or a symbol is left-recursive.
  bool checkFirstSets(const GrammarSource &Src, std::string &Error) const;
  /// First arc of state S that takes label L, directly or by a push.
  const Arc *firstArc(uint32_t S, uint32_t L) const;
  /// Pool offset of each distinct move, while compiling.
  using MoveIndex = std::map<std::vector<uint32_t>, uint32_t>;
  /// Appends the move of state S on label L to Pool, or finds the same
  /// move there; its move() value.
  uint32_t buildMove(uint32_t S, uint32_t L, MoveIndex &Index);

  struct KeywordSlot {
    uint32_t Hash;
    int32_t Label; ///< -1: empty slot
    uint32_t Offset, Len; ///< text in KeywordText
  };

  std::vector<Arc> Arcs;
  std::vector<State> States;
  std::vector<Dfa> Dfas;
  std::vector<uint64_t> FirstBits;
  std::vector<int32_t> SymbolDfas; ///< symbol - 256 -> DFA index or -1
  std::vector<uint32_t> Terminals; ///< label -> terminal index (symbols: 0)
  std::vector<uint32_t> Moves;     ///< [state][terminal], see move()
  /// Moves in 16 bits when the pool allows it (then Moves is empty): the
  /// table is read for every token, so half the cache lines matter.
  std::vector<uint16_t> NarrowMoves;
  std::vector<uint32_t> Pool;      ///< the moves' pushes
  std::vector<uint8_t> AcceptOnlyStates;
  size_t TerminalCount = 0;
  int32_t TokenLabels[256];
  std::vector<KeywordSlot> KeywordSlots; ///< open addressing, power of 2
  /// Bit lengthBit(N) is set when some keyword has N bytes: most names skip
  /// the hash.
  uint64_t KeywordLengths = 0;
  static unsigned lengthBit(size_t Len) {
    return Len < 63 ? static_cast<unsigned>(Len) : 63;
  }
  std::string KeywordText;
  size_t LabelCount = 0;
  int Start = 0;
};

} // namespace pgen

#endif
