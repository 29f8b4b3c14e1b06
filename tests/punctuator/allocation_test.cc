// After a handle has seen a text, punctuating texts no longer than it
// allocates nothing.
#include <gtest/gtest.h>

#include <atomic>
#include <cstdint>
#include <cstdlib>
#include <new>
#include <string>

#include "kvasr_punctuator_api.h"

namespace {

std::atomic<bool> counting{false};
std::atomic<long> allocations{0};

}  // namespace

void* operator new(std::size_t n) {
  if (counting) ++allocations;
  if (void* p = std::malloc(n ? n : 1)) return p;
  throw std::bad_alloc();
}
// This operator new takes its memory from malloc, so free is the match; GCC
// cannot see that and warns.
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wmismatched-new-delete"
void operator delete(void* p) noexcept { std::free(p); }
#pragma GCC diagnostic pop
void operator delete(void* p, std::size_t) noexcept { operator delete(p); }

namespace {

TEST(Allocation, NoneOnceBuffersHaveGrown) {
  const std::string d = KVASR_PUNCT_MODEL_DIR "/";
  void* h = punctuator_init((d + "model.bin").c_str(), (d + "vocab.txt").c_str(), (d + "punc.txt").c_str(),
                            (d + "num.txt").c_str(), (d + "case.txt").c_str(), (d + "xdb.txt").c_str(),
                            (d + "bpe.txt").c_str(), "en");
  ASSERT_NE(h, nullptr);
  const std::string texts[] = {
      "so what did you do in nineteen ninety five when you were twenty three years old and lived in paris",
      "we had three point five million people and one of them was called john",
      "ok",
  };
  char out[1024];
  int32_t size = sizeof out;
  ASSERT_EQ(punctuator_do_it(h, texts[0].c_str(), out, &size), 0);
  counting = true;
  for (const std::string& t : texts) {
    size = sizeof out;
    EXPECT_EQ(punctuator_do_it(h, t.c_str(), out, &size), 0);
  }
  counting = false;
  EXPECT_EQ(allocations.load(), 0);
  punctuator_relese(h);
}

}  // namespace
