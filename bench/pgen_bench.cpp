// Speed of the pgen engine alone (tables and driver, a sink that builds
// nothing) on token streams and grammar tables written by pgen_bench.py
// ($PGEN_BENCH_DATA).
#include "pgen/grammar.h"
#include "pgen/parser.h"

#include <benchmark/benchmark.h>

#include <cstdlib>
#include <fstream>
#include <iostream>
#include <memory>
#include <string>
#include <vector>

namespace {

struct Token {
  int Type;
  std::string Text; ///< NAME tokens only
};

struct Data {
  std::unique_ptr<pgen::Grammar> G;
  std::vector<std::vector<Token>> Streams;
  size_t Tokens = 0;
};

struct NullSink {
  bool push(int) { return true; }
  bool shift() { return true; }
  bool pop(int) { return true; }
};

/// Reads the file pgen_bench.py writes; null with a message on failure.
std::unique_ptr<Data> load(const char *Path, std::string &Error) {
  std::ifstream In(Path);
  std::string Word;
  int Version = 0;
  if (!(In >> Word >> Version) || Word != "pgen-bench" || Version != 1) {
    Error = "not a pgen-bench file";
    return nullptr;
  }
  pgen::GrammarSource Src;
  size_t N;
  In >> Word >> N;
  Src.Labels.resize(N);
  for (int &T : Src.Labels)
    In >> T;
  In >> Word >> N;
  Src.Tokens.resize(N);
  for (auto &T : Src.Tokens)
    In >> T.first >> T.second;
  In >> Word >> N;
  Src.Keywords.resize(N);
  for (auto &K : Src.Keywords)
    In >> K.first >> K.second;
  In >> Word >> Src.Start >> Word >> N;
  Src.Dfas.resize(N);
  for (auto &D : Src.Dfas) {
    size_t States, First;
    In >> Word >> D.Symbol >> States >> First;
    D.First.resize(First);
    for (int &L : D.First)
      In >> L;
    D.States.resize(States);
    for (auto &Arcs : D.States) {
      In >> Word >> N;
      Arcs.resize(N);
      for (auto &A : Arcs)
        In >> A.Label >> A.Next;
    }
  }
  auto Out = std::make_unique<Data>();
  Out->G = pgen::Grammar::compile(Src, Error);
  if (!Out->G)
    return nullptr;
  In >> Word >> N;
  Out->Streams.resize(N);
  for (auto &S : Out->Streams) {
    In >> N;
    S.resize(N);
    for (Token &T : S) {
      In >> T.Type >> T.Text;
      if (T.Type != pgen::NameTokenType)
        T.Text.clear();
    }
    Out->Tokens += N;
  }
  if (!In) {
    Error = "truncated pgen-bench file";
    return nullptr;
  }
  return Out;
}

void BM_EngineAlone(benchmark::State &State, const Data *D) {
  NullSink Sink;
  pgen::Parser<NullSink> P(*D->G, Sink);
  const int Start = D->G->startSymbol();
  for (auto _ : State) {
    for (const auto &S : D->Streams) {
      P.setup(Start);
      for (const Token &T : S) {
        pgen::Status St =
            P.addToken(T.Type, T.Text.empty() ? nullptr : T.Text.data(),
                       T.Text.size());
        if (St != pgen::Status::Ok)
          break;
      }
    }
  }
  State.SetItemsProcessed(State.iterations() * D->Tokens);
  // Seconds per token, printed with an SI prefix ("25n" is 25 ns).
  State.counters["per_token"] = benchmark::Counter(
      static_cast<double>(D->Tokens),
      benchmark::Counter::kIsIterationInvariantRate |
          benchmark::Counter::kInvert);
}

} // namespace

int main(int Argc, char **Argv) {
  benchmark::Initialize(&Argc, Argv);
  const char *Path = std::getenv("PGEN_BENCH_DATA");
  if (!Path) {
    std::cerr << "set PGEN_BENCH_DATA (bench/pgen_bench.py writes it)\n";
    return 2;
  }
  std::string Error;
  std::unique_ptr<Data> D = load(Path, Error);
  if (!D) {
    std::cerr << Path << ": " << Error << "\n";
    return 1;
  }
  std::cout << "engine alone: " << D->Streams.size() << " streams, "
            << D->Tokens << " tokens; tables " << D->G->tableBytes() / 1024
            << " KiB\n";
  benchmark::RegisterBenchmark("pgen/engine_alone", BM_EngineAlone, D.get())
      ->Unit(benchmark::kMillisecond);
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  return 0;
}
