// The platform's random library, as far as this library uses it. On the NAS libkelorandom provides
// it; elsewhere kelorandom.cpp stands in.

#ifndef KELODRCORE_PLATFORM_KELORANDOM_H_
#define KELODRCORE_PLATFORM_KELORANDOM_H_

namespace KELO::RANDOM {

class KELORandomBase {
 public:
  // A uniform draw from the closed range [min, max], from the kernel's generator.
  unsigned int urandom(unsigned int min, unsigned int max);
};

class KELORandom : public KELORandomBase {};

}  // namespace KELO::RANDOM

#endif  // KELODRCORE_PLATFORM_KELORANDOM_H_
