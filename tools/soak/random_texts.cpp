#include "random_texts.h"

#include <utility>

namespace mokutosoak {

namespace {

const std::vector<std::string> kWords = {
    "hello",  "my",    "friend", "how", "are",   "you",   "today", "I",      "like",
    "apples", "and",   "pears",  "but", "not",   "tea",   "or",    "coffee", "yeah",
    "think",  "happy", "one",    "two", "three", "there", "is",    "a",      "robot"};

}  // namespace

RandomTexts::RandomTexts(std::vector<std::string> animations, std::vector<std::string> tags,
                         std::vector<std::string> sounds, std::uint32_t seed)
    : fAnimations(std::move(animations)),
      fTags(std::move(tags)),
      fSounds(std::move(sounds)),
      fRandom(seed) {
  for (auto* list : {&fAnimations, &fTags, &fSounds}) {
    if (list->empty())
      list->push_back("nothing");
  }
}

const std::string& RandomTexts::pick(const std::vector<std::string>& from) {
  return from[std::uniform_int_distribution<std::size_t>(0, from.size() - 1)(fRandom)];
}

std::string RandomTexts::instruction() {
  const auto n = [this](int low, int high) {
    return std::to_string(std::uniform_int_distribution<int>(low, high)(fRandom));
  };
  switch (std::uniform_int_distribution<int>(0, 19)(fRandom)) {
    case 0:
      return "^start(" + pick(fAnimations) + ")";
    case 1:
      return "^run(" + pick(fAnimations) + ")";
    case 2:
      return "^wait(" + pick(fAnimations) + ")";
    case 3:
      return "^stop(" + pick(fAnimations) + ")";
    case 4:
      return "^startTag(" + pick(fTags) + ")";
    case 5:
      return "^runTag(" + pick(fTags) + ")";
    case 6:
      return "^waitTag(" + pick(fTags) + ")";
    case 7:
      return "^stopTag(" + pick(fTags) + ")";
    case 8:
      return "^startSound(" + pick(fSounds) + ", " + n(0, 100) + ")";
    case 9:
      return "^runSound(" + pick(fSounds) + ")";
    case 10:
      return "^waitSound(" + pick(fSounds) + ")";
    case 11:
      return "^stopSound(" + pick(fSounds) + ")";
    case 12:
      return "^call(ZUMemory.raiseEvent(\"soak\", " + n(0, 9) + "))";
    case 13:
      return "^pCall(ZUMemory.raiseEvent(\"soak\", [" + n(0, 9) + ", \"posted\"]))";
    case 14: {
      static const std::vector<std::string> modes = {"disabled", "random", "contextual"};
      return "^mode(" + pick(modes) + ")";
    }
    case 15:
      return "$soakKey=" + n(0, 99);
    case 16:
      return "\\pau=" + n(10, 300) + "\\";
    case 17:
      return "\\mrk=" + n(1, 9) + "\\";
    case 18:
      return "^inputMode2(on)";
    default: {
      // What the parser or the loader refuses.
      static const std::vector<std::string> refused = {
          "^nothing(x)",      "^start(animations/Stand/Nowhere/None_1)",
          "^runSound(bells)", "^call(ZUNowhere.method())",
          "^mode(sideways)",  "^startTag(unheardof)"};
      return pick(refused);
    }
  }
}

std::string RandomTexts::next() {
  std::string text;
  const int length = std::uniform_int_distribution<int>(1, 14)(fRandom);
  for (int k = 0; k < length; ++k) {
    if (!text.empty())
      text += ' ';
    text += std::uniform_int_distribution<int>(0, 3)(fRandom) == 0 ? instruction() : pick(kWords);
  }
  return text + '.';
}

}  // namespace mokutosoak
