// SPDX-License-Identifier: Apache-2.0
// Time to punctuate one recognised text, by length, with the shipped model
// (or the model folder named by KVASR_PUNCT_BENCH_MODEL, to time another
// shape before training it fully), through the C function the engine calls.
#include <benchmark/benchmark.h>

#include <cstdint>
#include <cstdlib>
#include <string>
#include <vector>

#include "kvasr_punctuator_api.h"

namespace {

const char kWords[] =
    "so i was thinking about what you said yesterday and i really do not know if we can finish the "
    "project by the end of the month because there are twenty three open issues and most of them "
    "need a lot of work from people who are already busy with other things";

void* Open() {
  const char* other = std::getenv("KVASR_PUNCT_BENCH_MODEL");
  const std::string d = std::string(other ? other : KVASR_PUNCT_MODEL_DIR) + "/";
  return punctuator_init((d + "model.bin").c_str(), (d + "vocab.txt").c_str(),
                         (d + "punc.txt").c_str(), (d + "num.txt").c_str(),
                         (d + "case.txt").c_str(), (d + "xdb.txt").c_str(), (d + "bpe.txt").c_str(),
                         "en");
}

void BM_Punctuate(benchmark::State& state) {
  void* h = Open();
  if (!h) {
    state.SkipWithError("model did not load");
    return;
  }
  std::vector<std::string> words;
  for (const char* p = kWords; *p;) {
    const char* e = p;
    while (*e && *e != ' ') ++e;
    words.emplace_back(p, e);
    p = *e ? e + 1 : e;
  }
  std::string text;
  for (int64_t i = 0; i < state.range(0); ++i)
    text += words[static_cast<size_t>(i) % words.size()] + " ";
  std::vector<char> out(1 << 20);
  // Alternate two texts so the library's cache of the last text never
  // answers.
  const std::string texts[2] = {text, "well " + text};
  size_t k = 0;
  for (auto _ : state) {
    int32_t size = static_cast<int32_t>(out.size());
    benchmark::DoNotOptimize(punctuator_do_it(h, texts[k ^= 1].c_str(), out.data(), &size));
  }
  state.SetItemsProcessed(state.iterations() * state.range(0));
  punctuator_relese(h);
}
BENCHMARK(BM_Punctuate)->Arg(5)->Arg(20)->Arg(50)->Arg(200)->Unit(benchmark::kMicrosecond);

}  // namespace

BENCHMARK_MAIN();
