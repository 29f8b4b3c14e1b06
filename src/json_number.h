// SPDX-License-Identifier: Apache-2.0
// Conversions of JSON numbers to fixed-width integers.
#ifndef KVASR_SRC_JSON_NUMBER_H_
#define KVASR_SRC_JSON_NUMBER_H_

#include <cstdint>

#include <cpprest/json.h>

namespace vorta {
namespace speech {

// Truncates toward zero; integers wrap modulo 2^32. A fraction outside the
// int32 range, NaN or infinity gives INT32_MIN, the value the x86-64 truncating
// conversion produces, instead of undefined behaviour.
int32_t JsonToInt32(const web::json::number& n);

// Truncates toward zero; integers wrap modulo 2^32, and so do fractions within
// the int64 range (as the x86-64 conversion through int64 does). Anything else
// gives 0.
uint32_t JsonToUint32(const web::json::number& n);

}  // namespace speech
}  // namespace vorta

#endif  // KVASR_SRC_JSON_NUMBER_H_
