// Processor features that select between builds of a hot loop.
#ifndef QUELLAN_CPU_FEATURES_H_
#define QUELLAN_CPU_FEATURES_H_

// True when the processor runs AVX instructions and the baseline loops have
// not been forced. Asked at first use rather than through the loader's
// indirect functions, whose resolvers run before a sanitizer's runtime is
// ready.
bool cpu_has_avx();

// With on, cpu_has_avx answers false from then on, so the loops built for
// processors without AVX run (and can be checked) on any machine.
void cpu_force_baseline(bool on);

#endif  // QUELLAN_CPU_FEATURES_H_
