// Table-driven LL(1) parse driver over a compiled Grammar, with an explicit
// stack. It builds no tree: it reports pushes, shifts and pops to a sink.
#ifndef TREELENS_PGEN_PARSER_H
#define TREELENS_PGEN_PARSER_H

#include "grammar.h"

#include <cstddef>
#include <vector>

namespace pgen {

/// Result of Parser::addToken. After an error every addToken gives NotReady
/// until the next setup().
enum class Status {
  Ok,           ///< token accepted, input not complete
  Done,         ///< token accepted and the start symbol is complete
  BadInput,     ///< the grammar does not accept the token here
  BadToken,     ///< the grammar has no label for the token
  TooMuchInput, ///< a token after the start symbol was complete
  TooDeep,      ///< more than MaxDepth nonterminals open
  Aborted,      ///< the sink refused a callback
  NotReady,     ///< no setup() since construction or since the last error
};

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
  /// Open nonterminals allowed at once; the bound of CPython's own parser.
  static constexpr size_t MaxDepth = 1500;

  Parser(const Grammar &G, Sink &S) : G(G), S(S) { Stack.reserve(MaxDepth); }

  /// Starts a new input at StartSymbol; false when it has no DFA.
  bool setup(int StartSymbol) {
    reset();
    int D = G.dfaOfSymbol(StartSymbol);
    if (D < 0)
      return false;
    Stack.push_back(Frame{static_cast<uint32_t>(D), G.dfa(D).FirstState});
    Latched = Status::Ok;
    return true;
  }

  /// Drops the input; addToken gives NotReady until setup().
  void reset() {
    Stack.clear();
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
    const uint32_t Label = static_cast<uint32_t>(L);
    for (;;) {
      Frame &Top = Stack.back();
      const Grammar::State &St = G.state(Top.State);
      const Grammar::Arc *A = &G.arc(St.FirstArc);
      const Grammar::Arc *End = A + St.NumArcs;
      for (; A != End; ++A) {
        if (A->Label == Label) {
          if (!S.shift())
            return fail(Status::Aborted);
          Top.State = A->Next;
          // Pop every nonterminal left in a state that can only accept.
          while (G.state(Stack.back().State).AcceptOnly) {
            if (!popFrame())
              return fail(Status::Aborted);
            if (Stack.empty())
              return Latched = Status::Done;
          }
          return Status::Ok;
        }
        if (A->Push >= 0 && G.inFirst(G.dfa(A->Push), Label)) {
          if (Stack.size() >= MaxDepth)
            return fail(Status::TooDeep);
          Top.State = A->Next;
          const Grammar::Dfa &D = G.dfa(A->Push);
          Stack.push_back(Frame{static_cast<uint32_t>(A->Push), D.FirstState});
          if (!S.push(D.Symbol))
            return fail(Status::Aborted);
          break;
        }
      }
      if (A != End)
        continue;
      if (!St.CanAccept)
        return fail(Status::BadInput);
      if (!popFrame())
        return fail(Status::Aborted);
      if (Stack.empty())
        return fail(Status::TooMuchInput);
    }
  }

  Status status() const { return Latched; }
  /// Nonterminals open now.
  size_t depth() const { return Stack.size(); }

private:
  /// One open nonterminal: its DFA and current (global) state.
  struct Frame {
    uint32_t Dfa;
    uint32_t State;
  };

  bool popFrame() {
    int Symbol = G.dfa(Stack.back().Dfa).Symbol;
    Stack.pop_back();
    return S.pop(Symbol);
  }

  /// Latches an error; a parser stopped by one needs setup() again.
  Status fail(Status E) {
    Latched = Status::NotReady;
    return E;
  }

  const Grammar &G;
  Sink &S;
  std::vector<Frame> Stack; ///< innermost last; empty when done
  Status Latched = Status::NotReady;
};

} // namespace pgen

#endif
