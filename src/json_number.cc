// SPDX-License-Identifier: Apache-2.0
#include "json_number.h"

#include <cmath>
#include <limits>

namespace vorta {
namespace speech {

int32_t JsonToInt32(const web::json::number& n) {
  if (n.is_integral()) return n.to_int32();
  const double d = n.to_double();
  // The half-open range: 2147483647.5 still truncates into int32.
  if (!(d > -2147483649.0 && d < 2147483648.0)) return std::numeric_limits<int32_t>::min();
  return static_cast<int32_t>(d);
}

uint32_t JsonToUint32(const web::json::number& n) {
  if (n.is_integral()) return n.to_uint32();
  const double d = n.to_double();
  constexpr double kTwoTo63 = 9223372036854775808.0;
  if (!(d > -kTwoTo63 && d < kTwoTo63)) return 0;
  return static_cast<uint32_t>(static_cast<int64_t>(d));
}

}  // namespace speech
}  // namespace vorta
