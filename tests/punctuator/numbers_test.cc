// SPDX-License-Identifier: Apache-2.0
// Spelled numbers to digits with the shipped rule files.
#include <gtest/gtest.h>

#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "numbers.h"

namespace kvasr {
namespace punct {
namespace {

class NumbersTest : public testing::Test {
 protected:
  static void SetUpTestSuite() {
    std::string error;
    ASSERT_TRUE(
        rules_.Load(KVASR_PUNCT_MODEL_DIR "/num.txt", KVASR_PUNCT_MODEL_DIR "/xdb.txt", &error))
        << error;
  }

  // `text` with the rules applied; '|' after a word stands for a mark the
  // network put there.
  static std::string Normalise(const std::string& text) {
    std::vector<std::string> storage;
    std::vector<bool> stop;
    std::istringstream in(text);
    std::string w;
    while (in >> w) {
      const bool marked = w.back() == '|';
      if (marked) w.pop_back();
      storage.push_back(w);
      stop.push_back(marked);
    }
    std::vector<std::string_view> words(storage.begin(), storage.end());
    std::vector<Span> spans;
    std::string scratch;
    rules_.Apply(words, stop, &spans, &scratch);
    std::string out;
    int expect_first = 0;
    for (const Span& s : spans) {
      EXPECT_EQ(s.first, expect_first) << text;
      expect_first = s.last + 1;
      if (!out.empty()) out += ' ';
      out += s.number ? scratch.substr(s.text_offset, s.text_size) : storage[s.first];
    }
    EXPECT_EQ(expect_first, static_cast<int>(words.size())) << text;
    return out;
  }

  static NumberRules rules_;
};

NumberRules NumbersTest::rules_;

struct Case {
  const char* in;
  const char* out;
};

// Cardinals said plainly and years said in pairs are SpelledNumbersAndYears'.
const Case kCases[] = {
    // Numbers within text; "and"; round hundreds and thousands.
    {"twenty one people", "21 people"},
    {"about thirty seven percent", "about 37 percent"},
    {"in nineteen eighty four", "in 1984"},
    {"two hundred and five", "205"},
    {"two thousand and ten", "2010"},
    {"two thousand and eight", "2008"},
    {"twenty five hundred", "2500"},
    {"fifteen hundred", "1500"},
    {"nineteen hundred", "1900"},
    {"ten thousand", "10,000"},
    {"fifty thousand people", "50,000 people"},
    {"one hundred twenty three thousand four hundred fifty six", "123,456"},
    {"one million two hundred thousand", "1,200,000"},
    {"a hundred and fifty", "150"},
    {"a thousand and one nights", "1001 nights"},
    // Round large numbers keep the scale word.
    {"two million", "2 million"},
    {"three hundred million", "300 million"},
    {"seven billion people", "7 billion people"},
    {"one trillion", "1 trillion"},
    {"two point five billion", "2.5 billion"},
    // Years and decades said otherwise.
    {"nineteen oh five", "1905"},
    {"nineteen sixties", "1960s"},
    // Decimals.
    {"three point five", "3.5"},
    {"zero point two", "0.2"},
    {"three point one four", "3.14"},
    {"one point oh five", "1.05"},
    {"ninety nine point nine percent", "99.9 percent"},
    // Ordinals.
    {"twenty first century", "21st century"},
    {"the twenty second", "the 22nd"},
    {"the thirty third floor", "the 33rd floor"},
    {"eleventh", "11th"},
    {"twelfth", "12th"},
    {"the hundredth time", "the hundredth time"},
    {"one hundredth", "100th"},
    {"fortieth birthday", "40th birthday"},
    {"one hundred and first", "101st"},
    {"the first time", "the first time"},
    {"second place", "second place"},
    // Small numbers and idioms stay in words.
    {"one of them", "one of them"},
    {"two people", "two people"},
    {"no one", "no one"},
    {"one another", "one another"},
    {"zero", "zero"},
    {"nine lives", "nine lives"},
    {"one two three", "one two three"},
    {"a hundred", "a hundred"},
    {"a million dollars", "a million dollars"},
    {"a thousand years", "a thousand years"},
    {"hundreds of thousands", "hundreds of thousands"},
    {"fifty fifty", "fifty fifty"},
    {"twenty four seven", "twenty four seven"},
    {"nine to five", "nine to five"},
    {"thousands", "thousands"},
    {"the sixties", "the sixties"},
    {"point", "point"},
    {"the point is", "the point is"},
    {"hundred", "hundred"},
    {"and", "and"},
    {"oh no", "oh no"},
    {"a lot", "a lot"},
    // Where a number stops.
    {"twenty three four", "23 four"},
    {"one hundred and", "100 and"},
    {"two thousand and", "2000 and"},
    {"seven point", "seven point"},
    {"thirty forty", "30 40"},
    {"million", "million"},
    {"thousand two", "thousand two"},
    // A mark the network placed inside splits the number.
    {"twenty| three", "20 three"},
    {"nineteen| ninety five", "19 95"},
    {"one hundred| twenty", "100 20"},
    {"three point| five", "three point five"},
    // Not number words.
    {"twentyish", "twentyish"},
    {"tenth-grade", "tenth-grade"},
    {"", ""},
};

TEST_F(NumbersTest, Table) {
  for (const Case& c : kCases) EXPECT_EQ(Normalise(c.in), c.out) << "input: " << c.in;
}

// An independent speller: "one thousand nine hundred ninety five".
std::string Spell(int n) {
  static const char* kUnits[] = {"zero",    "one",     "two",       "three",    "four",
                                 "five",    "six",     "seven",     "eight",    "nine",
                                 "ten",     "eleven",  "twelve",    "thirteen", "fourteen",
                                 "fifteen", "sixteen", "seventeen", "eighteen", "nineteen"};
  static const char* kTens[] = {"",      "",      "twenty",  "thirty", "forty",
                                "fifty", "sixty", "seventy", "eighty", "ninety"};
  std::string s;
  const auto add = [&](const std::string& w) { s += (s.empty() ? "" : " ") + w; };
  if (n >= 1000) add(std::string(kUnits[n / 1000]) + " thousand"), n %= 1000;
  if (n >= 100) add(std::string(kUnits[n / 100]) + " hundred"), n %= 100;
  if (n >= 20) {
    add(kTens[n / 10]);
    if (n % 10) add(kUnits[n % 10]);
  } else if (n > 0) {
    add(kUnits[n]);
  }
  return s;
}

// Every number from 10 to 9999 said the long way, and every year from 1110
// to 2099 said in pairs ("nineteen ninety five"), comes back as its digits.
TEST_F(NumbersTest, SpelledNumbersAndYears) {
  std::vector<std::pair<std::string, int>> spoken;
  for (int n = 10; n < 10000; ++n) spoken.emplace_back(Spell(n), n);
  for (int year = 1110; year <= 2099; ++year) {
    if (year % 100 >= 10) spoken.emplace_back(Spell(year / 100) + " " + Spell(year % 100), year);
  }
  int failures = 0;
  for (const auto& [text, n] : spoken) {
    const std::string got = Normalise(text);
    if (got != std::to_string(n) && ++failures <= 10) ADD_FAILURE() << text << " -> " << got;
  }
  EXPECT_EQ(failures, 0);
}

TEST(NumberRulesLoad, RejectsBadFiles) {
  NumberRules rules;
  std::string error;
  EXPECT_FALSE(rules.Load("/nonexistent/num.txt", "", &error));
  EXPECT_NE(error.find("cannot open"), std::string::npos) << error;
  // The xdb file is a vocabulary of phrases, not number words.
  EXPECT_FALSE(rules.Load(KVASR_PUNCT_MODEL_DIR "/xdb.txt", "", &error));
  EXPECT_FALSE(
      rules.Load(KVASR_PUNCT_MODEL_DIR "/num.txt", KVASR_PUNCT_MODEL_DIR "/num.txt", &error));
  EXPECT_TRUE(rules.Load(KVASR_PUNCT_MODEL_DIR "/num.txt", "", &error)) << error;
}

}  // namespace
}  // namespace punct
}  // namespace kvasr
