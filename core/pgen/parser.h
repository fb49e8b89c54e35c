// Table-driven LL(1) parse driver over a compiled Grammar, with an explicit
// stack. It builds no tree: it reports pushes, shifts and pops to a sink.
#ifndef TREELENS_PGEN_PARSER_H
#define TREELENS_PGEN_PARSER_H

#include "grammar.h"

#include <cstddef>
#include <memory>

namespace pgen {

/// Result of Parser::addToken. After an error every addToken gives NotReady
/// until the next setup().
enum class Status {
  Ok,           ///< token accepted, input not complete
  Done,         ///< token accepted and the start symbol is complete
  BadInput,     ///< the grammar does not accept the token here
  BadToken,     ///< the grammar has no label for the token
  TooMuchInput, ///< a token after the start symbol was complete
  TooDeep,      ///< more than the parser's maxDepth() nonterminals open
  NoProgress,   ///< the grammar pushes and pops without taking the token
  Aborted,      ///< the sink refused a callback
  NotReady,     ///< no setup() since construction or since the last error
};

/// Open nonterminals allowed at once by default; the bound of CPython's own
/// parser before 3.8 (3.8's is 1700).
constexpr size_t MaxParseDepth = 1500;

/// The largest bound a parser may be given.
constexpr size_t MaxParseDepthLimit = 100000;

/// Pushes and pops one token may cause at most, per open nonterminal allowed.
/// A compiled grammar needs at most the pops of the open frames, one push
/// chain and the pops after the shift; first sets that disagree with the arcs
/// would loop forever.
constexpr size_t StepsPerDepth = 4;

/// Drives one parse at a time over a shared Grammar.
///
/// Sink must provide, each returning false to abort the parse:
///   bool push(int Symbol);  // a nonterminal opens at the current token
///   bool shift();           // the current token joins the innermost one
///   bool pop(int Symbol);   // the innermost nonterminal is complete; the
///                           // stack is empty after the start symbol's pop
/// setup() calls none of them: the sink opens the start symbol itself.
template <class Sink> class Parser {
public:
  /// Limit: the most nonterminals open at once, 1..MaxParseDepthLimit.
  Parser(const Grammar &G, Sink &S, size_t Limit = MaxParseDepth)
      : MaxDepth(Limit), G(G), S(S), Stack(new Frame[Limit]) {}

  /// The most nonterminals open at once (TooDeep beyond).
  const size_t MaxDepth;

  /// Starts a new input at StartSymbol; false when it has no DFA.
  bool setup(int StartSymbol) {
    reset();
    int D = G.dfaOfSymbol(StartSymbol);
    if (D < 0)
      return false;
    Stack[Depth++] = Frame{StartSymbol, G.dfa(D).FirstState};
    Latched = Status::Ok;
    return true;
  }

  /// Drops the input; addToken gives NotReady until setup().
  void reset() {
    Depth = 0;
    Latched = Status::NotReady;
  }

  /// Feeds one token; Text is the token text used for keyword lookup (may be
  /// null for a token that is no keyword).
  Status addToken(int Type, const char *Text, size_t Len) {
    if (Latched != Status::Ok)
      return Latched == Status::Done ? fail(Status::TooMuchInput) : Latched;
    int L = G.classify(Type, Text, Len);
    if (L < 0)
      return fail(Status::BadToken);
    const uint32_t Terminal = G.terminalOf(static_cast<uint32_t>(L));
    for (size_t Steps = 0;; ++Steps) {
      if (Steps == StepsPerDepth * MaxDepth)
        return fail(Status::NoProgress);
      uint32_t M = G.move(top().State, Terminal);
      if (M < Grammar::MoveFirst) {
        // No arc takes the token: an accepting state pops, else an error.
        if (M == Grammar::MoveError)
          return fail(Status::BadInput);
        if (!popFrame())
          return fail(Status::Aborted);
        if (Depth == 0)
          return fail(Status::TooMuchInput);
        continue;
      }
      // Open the symbols the token starts, then shift it.
      const uint32_t *P = G.movePool(M);
      const uint32_t Pushes = P[0] & ~Grammar::MoveShifts;
      const bool Shifts = (P[0] & Grammar::MoveShifts) != 0;
      ++P;
      if (Depth + Pushes > MaxDepth)
        return fail(Status::TooDeep);
      for (uint32_t I = 0; I < Pushes; ++I, P += 2) {
        top().State = P[0];
        Stack[Depth++] = Frame{static_cast<int>(P[1]), 0};
        if (!S.push(static_cast<int>(P[1])))
          return fail(Status::Aborted);
      }
      top().State = *P;
      if (!Shifts)
        continue;
      if (!S.shift())
        return fail(Status::Aborted);
      // Pop every nonterminal left in a state that can only accept.
      while (G.acceptOnly(top().State)) {
        if (!popFrame())
          return fail(Status::Aborted);
        if (Depth == 0)
          return Latched = Status::Done;
      }
      return Status::Ok;
    }
  }

  Status status() const { return Latched; }
  /// Nonterminals open now.
  size_t depth() const { return Depth; }

private:
  /// One open nonterminal: its symbol and current (global) state.
  struct Frame {
    int Symbol;
    uint32_t State;
  };

  bool popFrame() {
    int Symbol = Stack[--Depth].Symbol;
    return S.pop(Symbol);
  }

  /// Latches an error; a parser stopped by one needs setup() again.
  Status fail(Status E) {
    Latched = Status::NotReady;
    return E;
  }

  Frame &top() { return Stack[Depth - 1]; }

  const Grammar &G;
  Sink &S;
  /// Stack[0, Depth): the open nonterminals, innermost last; empty when done.
  std::unique_ptr<Frame[]> Stack;
  size_t Depth = 0;
  Status Latched = Status::NotReady;
};

} // namespace pgen

#endif
