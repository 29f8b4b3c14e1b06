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

#include "punct_test_support.h"

namespace {

// float16 weights, float32 arithmetic in both, different summation order.
constexpr float kTolerance = 2e-3f;

std::vector<float> ParseFloats(const std::string& s) {
  std::istringstream in(s);
  std::vector<float> v;
  float x;
  while (in >> x) v.push_back(x);
  return v;
}

}  // namespace

int main(int argc, char** argv) {
  const bool baseline = argc == 4 && std::string(argv[3]) == "--baseline";
  if (argc != 3 && !baseline) {
    std::cerr << "usage: " << argv[0] << " MODEL_DIR REFERENCE_TSV [--baseline]\n";
    return 2;
  }
  kvasr::punct::UseBaselineProducts(baseline);
  std::string error;
  auto p = kvasr::punct::test::LoadModelDir(argv[1], &error);
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
  int texts = 0, values = 0, bad = 0;
  float worst = 0.0f;
  std::vector<std::vector<std::string>> rows;
  std::string text;
  const auto check = [&] {
    if (text.empty()) return;
    std::vector<float> punct, casing;
    p->Logits(text.c_str(), &punct, &casing);
    if (rows.empty() || punct.size() != rows.size() * ParseFloats(rows[0][1]).size() ||
        casing.size() != rows.size() * ParseFloats(rows[0][2]).size()) {
      std::cerr << "output shape differs for '" << text << "'\n";
      ++bad;
      return;
    }
    const auto compare = [&](const std::vector<float>& want, const std::vector<float>& got, size_t row) {
      for (size_t k = 0; k < want.size(); ++k) {
        const float d = std::fabs(want[k] - got[row * want.size() + k]);
        worst = std::max(worst, d);
        bad += d > kTolerance;
        ++values;
      }
    };
    for (size_t w = 0; w < rows.size(); ++w) {
      compare(ParseFloats(rows[w][1]), punct, w);
      compare(ParseFloats(rows[w][2]), casing, w);
    }
    ++texts;
  };
  while (std::getline(in, line)) {
    std::vector<std::string> f;
    std::istringstream fields(line);
    std::string field;
    while (std::getline(fields, field, '\t')) f.push_back(field);
    if (f.size() == 2 && f[0] == "text") {
      check();
      text = f[1];
      rows.clear();
    } else if (f.size() == 3) {
      rows.push_back(f);
    }
  }
  check();
  std::printf("%d texts, %d values, largest difference %.2g, %d beyond %.0e\n", texts, values, worst, bad,
              kTolerance);
  return bad == 0 && texts > 0 && values > 0 ? 0 : 1;
}
