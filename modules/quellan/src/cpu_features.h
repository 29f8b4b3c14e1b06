// Processor features that select between builds of a hot loop.
#ifndef QUELLAN_CPU_FEATURES_H_
#define QUELLAN_CPU_FEATURES_H_

// True when the processor runs AVX instructions. Asked at first use rather
// than through the loader's indirect functions, whose resolvers run before
// a sanitizer's runtime is ready.
bool cpu_has_avx();

#endif  // QUELLAN_CPU_FEATURES_H_
