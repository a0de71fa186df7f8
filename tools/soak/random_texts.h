#pragma once
// Random annotated texts for the long runs and the stress test: words, pauses and caller
// bookmarks with every kind of instruction (animations and tags started, run, waited for
// and stopped, sounds, calls, posted calls, modes, memory keys, input mode 2) and now and
// then one that the parser or the loader refuses.
//
// A generator is used by one thread at a time.

#include <cstdint>
#include <random>
#include <string>
#include <vector>

namespace mokutosoak {

class RandomTexts {
 public:
  // `animations`: paths; `tags`; `sounds`: "set/name".
  RandomTexts(std::vector<std::string> animations, std::vector<std::string> tags,
              std::vector<std::string> sounds, std::uint32_t seed);

  std::string next();

 private:
  const std::string& pick(const std::vector<std::string>& from);
  std::string instruction();

  std::vector<std::string> fAnimations;
  std::vector<std::string> fTags;
  std::vector<std::string> fSounds;
  std::mt19937 fRandom;
};

}  // namespace mokutosoak
