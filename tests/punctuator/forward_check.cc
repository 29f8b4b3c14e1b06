// SPDX-License-Identifier: Apache-2.0
// Compares the library's network output with the logits the trainer wrote
// for the same texts (train.py --forward-check). Exit status 0 when every
// value agrees within the tolerance. With --baseline the products run the
// code for processors without AVX2.
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <fstream>
#include <iostream>
#include <sstream>
#include <string>
#include <vector>

#include "cpu_dispatch.h"
#include "punctuator.h"

namespace {

// float16 weights, float32 arithmetic in both, different summation order.
constexpr float kTolerance = 2e-3f;

// The trainer's logits for one text, word after word, as Logits lays them out.
struct Reference {
  std::string text;
  std::vector<float> punct, casing;
};

void AppendFloats(const std::string& s, std::vector<float>* v) {
  std::istringstream in(s);
  for (float x; in >> x;) v->push_back(x);
}

}  // namespace

int main(int argc, char** argv) {
  const bool baseline = argc == 4 && std::string(argv[3]) == "--baseline";
  if (argc != 3 && !baseline) {
    std::cerr << "usage: " << argv[0] << " MODEL_DIR REFERENCE_TSV [--baseline]\n";
    return 2;
  }
  kvasr_common::ForceBaseline(baseline);
  const std::string d = std::string(argv[1]) + "/";
  std::string error;
  const auto p = kvasr::punct::Punctuator::Create(
      {d + "model.bin", d + "vocab.txt", d + "punc.txt", d + "num.txt", d + "case.txt",
       d + "xdb.txt", d + "bpe.txt"},
      "en", &error);
  if (!p) {
    std::cerr << error << "\n";
    return 1;
  }
  std::ifstream in(argv[2]);
  std::string line;
  if (!std::getline(in, line) || line != "#kvasr-punct-forward-check 1") {
    std::cerr << "not a forward-check file: " << argv[2] << "\n";
    return 1;
  }
  std::vector<Reference> references;
  while (std::getline(in, line)) {
    std::vector<std::string> f;
    std::istringstream fields(line);
    for (std::string field; std::getline(fields, field, '\t');) f.push_back(field);
    if (f.size() == 2 && f[0] == "text") {
      references.push_back({f[1], {}, {}});
    } else if (f.size() == 3 && !references.empty()) {
      AppendFloats(f[1], &references.back().punct);
      AppendFloats(f[2], &references.back().casing);
    }
  }
  int values = 0, bad = 0;
  float worst = 0.0f;
  const auto compare = [&](const std::vector<float>& want, const std::vector<float>& got) {
    for (size_t k = 0; k < want.size(); ++k) {
      const float diff = std::fabs(want[k] - got[k]);
      worst = std::max(worst, diff);
      bad += diff > kTolerance;
      ++values;
    }
  };
  std::vector<float> punct, casing;
  for (const Reference& r : references) {
    p->Logits(r.text.c_str(), &punct, &casing);
    if (punct.size() != r.punct.size() || casing.size() != r.casing.size()) {
      std::cerr << "output shape differs for '" << r.text << "'\n";
      ++bad;
      continue;
    }
    compare(r.punct, punct);
    compare(r.casing, casing);
  }
  std::printf("%zu texts, %d values, largest difference %.2g, %d beyond %.0e\n", references.size(),
              values, worst, bad, kTolerance);
  return bad == 0 && values > 0 ? 0 : 1;
}
