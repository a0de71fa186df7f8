#include "ko/log.hpp"

#include <algorithm>
#include <cstdlib>
#include <map>
#include <shared_mutex>

#include <spdlog/sinks/stdout_color_sinks.h>
#include <spdlog/spdlog.h>

namespace ko::log {

namespace {

constexpr const char* kLevelNames[] = {"silent", "fatal",   "error", "warning",
                                       "info",   "verbose", "debug"};
constexpr Level kDefaultLevel = Info;

struct Rule {
  std::string pattern;
  Level level;
};

// Writes lines to standard error through spdlog.
class StderrSink : public Sink {
 public:
  StderrSink() {
    auto sink = std::make_shared<spdlog::sinks::stderr_color_sink_mt>();
    logger_ = std::make_shared<spdlog::logger>("ko", std::move(sink));
    logger_->set_pattern("%Y-%m-%d %H:%M:%S.%e %^%v%$");
    logger_->set_level(spdlog::level::trace);
  }
  void consume(const Record& r) override {
    static constexpr spdlog::level::level_enum kMap[] = {
        spdlog::level::off,  spdlog::level::critical, spdlog::level::err,  spdlog::level::warn,
        spdlog::level::info, spdlog::level::debug,    spdlog::level::trace};
    logger_->log(kMap[static_cast<int>(r.level)], "[{}] {}: {}: {}", levelName(r.level), r.category,
                 r.function, r.message);
  }

 private:
  std::shared_ptr<spdlog::logger> logger_;
};

// Process-wide state: categories, level rules and sinks.
class Registry {
 public:
  static Registry& instance() {
    static Registry* registry = new Registry();  // never destroyed: logging may run at exit
    return *registry;
  }

  Category& category(std::string_view name) {
    {
      std::shared_lock lock(mutex_);
      if (auto it = categories_.find(name); it != categories_.end())
        return *it->second;
    }
    std::unique_lock lock(mutex_);
    auto it = categories_.find(name);
    if (it == categories_.end()) {
      it = categories_
               .emplace(std::string(name),
                        std::make_unique<Category>(std::string(name), levelFor(name)))
               .first;
    }
    return *it->second;
  }

  void addRules(std::vector<Rule> rules) {
    std::unique_lock lock(mutex_);
    rules_.insert(rules_.begin(), std::make_move_iterator(rules.begin()),
                  std::make_move_iterator(rules.end()));
    applyRules();
  }

  void resetRules() { replaceRules({}); }

  std::vector<Rule> rules() {
    std::shared_lock lock(mutex_);
    return rules_;
  }

  void replaceRules(std::vector<Rule> rules) {
    std::unique_lock lock(mutex_);
    rules_ = std::move(rules);
    applyRules();
  }

  std::shared_ptr<const std::vector<std::shared_ptr<Sink>>> sinks() {
    std::lock_guard lock(sinkMutex_);
    return sinks_;
  }

  void addSink(std::shared_ptr<Sink> sink) {
    std::lock_guard lock(sinkMutex_);
    auto next = std::make_shared<std::vector<std::shared_ptr<Sink>>>(*sinks_);
    next->push_back(std::move(sink));
    sinks_ = std::move(next);
  }

  void removeSink(const std::shared_ptr<Sink>& sink) {
    std::lock_guard lock(sinkMutex_);
    auto next = std::make_shared<std::vector<std::shared_ptr<Sink>>>(*sinks_);
    next->erase(std::remove(next->begin(), next->end(), sink), next->end());
    sinks_ = std::move(next);
  }

  void setDefaultSinkEnabled(bool enabled) {
    removeSink(defaultSink_);
    if (enabled)
      addSink(defaultSink_);
  }

 private:
  Registry() : defaultSink_(std::make_shared<StderrSink>()) {
    sinks_ = std::make_shared<std::vector<std::shared_ptr<Sink>>>(
        std::vector<std::shared_ptr<Sink>>{defaultSink_});
    if (const char* env = std::getenv("ZEFOKO_LOG"); env && *env) {
      std::vector<Rule> rules;
      if (parseSpec(env, rules))
        rules_ = std::move(rules);
      else
        std::fprintf(stderr, "ZEFOKO_LOG: ignoring malformed level rules \"%s\"\n", env);
    }
  }

 public:
  static bool parseSpec(std::string_view spec, std::vector<Rule>& out) {
    std::vector<Rule> rules;
    while (!spec.empty()) {
      const auto comma = spec.find(',');
      std::string_view item = spec.substr(0, comma);
      spec = comma == std::string_view::npos ? std::string_view() : spec.substr(comma + 1);
      while (!item.empty() && item.front() == ' ')
        item.remove_prefix(1);
      while (!item.empty() && item.back() == ' ')
        item.remove_suffix(1);
      if (item.empty())
        continue;
      const auto eq = item.rfind('=');
      std::string_view pattern = eq == std::string_view::npos ? "*" : item.substr(0, eq);
      std::string_view levelText = eq == std::string_view::npos ? item : item.substr(eq + 1);
      Level level;
      if (pattern.empty() || !parseLevel(levelText, level))
        return false;
      rules.push_back({std::string(pattern), level});
    }
    out = std::move(rules);
    return true;
  }

 private:
  Level levelFor(std::string_view name) const {
    for (const auto& r : rules_) {
      if (globMatch(r.pattern, name))
        return r.level;
    }
    return kDefaultLevel;
  }

  void applyRules() {
    for (auto& [name, cat] : categories_)
      cat->setLevel(levelFor(name));
  }

  std::shared_mutex mutex_;
  std::map<std::string, std::unique_ptr<Category>, std::less<>> categories_;
  std::vector<Rule> rules_;

  std::mutex sinkMutex_;
  std::shared_ptr<Sink> defaultSink_;
  std::shared_ptr<const std::vector<std::shared_ptr<Sink>>> sinks_;
};

}  // namespace

const char* levelName(Level level) noexcept {
  const int l = static_cast<int>(level);
  return l >= 0 && l <= 6 ? kLevelNames[l] : "unknown";
}

bool parseLevel(std::string_view text, Level& out) noexcept {
  if (text.size() == 1 && text[0] >= '0' && text[0] <= '6') {
    out = static_cast<Level>(text[0] - '0');
    return true;
  }
  for (int l = 0; l <= 6; ++l) {
    if (text == kLevelNames[l]) {
      out = static_cast<Level>(l);
      return true;
    }
  }
  return false;
}

bool globMatch(std::string_view pattern, std::string_view name) noexcept {
  // Iterative wildcard match with backtracking to the last '*'.
  std::size_t p = 0, n = 0, star = std::string_view::npos, mark = 0;
  while (n < name.size()) {
    if (p < pattern.size() && pattern[p] == '*') {
      star = p++;
      mark = n;
    } else if (p < pattern.size() && pattern[p] == name[n]) {
      ++p;
      ++n;
    } else if (star != std::string_view::npos) {
      p = star + 1;
      n = ++mark;
    } else {
      return false;
    }
  }
  while (p < pattern.size() && pattern[p] == '*')
    ++p;
  return p == pattern.size();
}

Category& category(std::string_view name) {
  return Registry::instance().category(name);
}

void setLevel(std::string_view pattern, Level level) {
  Registry::instance().addRules({Rule{std::string(pattern), level}});
}

bool setLevels(std::string_view spec) {
  std::vector<Rule> rules;
  if (!Registry::parseSpec(spec, rules))
    return false;
  Registry::instance().addRules(std::move(rules));
  return true;
}

void resetLevels() {
  Registry::instance().resetRules();
}

void addSink(std::shared_ptr<Sink> sink) {
  Registry::instance().addSink(std::move(sink));
}
void removeSink(const std::shared_ptr<Sink>& sink) {
  Registry::instance().removeSink(sink);
}
void setDefaultSinkEnabled(bool enabled) {
  Registry::instance().setDefaultSinkEnabled(enabled);
}

std::string qualifiedFunctionName(std::string_view pretty) {
  // Lambdas read "ZU::A::f()::<lambda()>": name them after the enclosing function.
  if (auto lambda = pretty.find("::<lambda"); lambda != std::string_view::npos) {
    pretty = pretty.substr(0, lambda);
  }
  if (auto with = pretty.find(" [with "); with != std::string_view::npos) {
    pretty = pretty.substr(0, with);
  }
  // The parameter list: the parenthesis that matches the last ')'.
  std::size_t end = pretty.size();
  if (auto close = pretty.rfind(')'); close != std::string_view::npos) {
    int depth = 0;
    for (std::size_t i = close + 1; i-- > 0;) {
      if (pretty[i] == ')')
        ++depth;
      else if (pretty[i] == '(' && --depth == 0) {
        end = i;
        break;
      }
    }
  }
  // An operator's name holds symbols and blanks of its own ("operator<<",
  // "operator const std::string&"): look for the start before its keyword.
  std::size_t scanFrom = end;
  for (std::size_t at = pretty.rfind("operator", end); at != std::string_view::npos;
       at = at == 0 ? std::string_view::npos : pretty.rfind("operator", at - 1)) {
    const auto identifierChar = [](char c) {
      return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '_';
    };
    const std::size_t after = at + 8;
    const bool keyword = (at == 0 || pretty[at - 1] == ' ' || pretty[at - 1] == ':') &&
                         after < end && !identifierChar(pretty[after]);
    if (keyword) {
      scanFrom = at;
      break;
    }
  }
  // The start: the last blank outside template arguments before the name.
  std::size_t begin = 0;
  int depth = 0;
  for (std::size_t i = scanFrom; i-- > 0;) {
    const char c = pretty[i];
    if (c == '>' || c == ')')
      ++depth;
    else if (c == '<' || c == '(')
      --depth;
    else if (c == ' ' && depth == 0) {
      begin = i + 1;
      break;
    }
  }
  std::string_view name = pretty.substr(begin, end - begin);
  while (!name.empty() && (name.front() == '*' || name.front() == '&'))
    name.remove_prefix(1);
  return std::string(name);
}

void write(const Category& category, Level level, std::string_view prettyFunction,
           std::string message, const char* file, int line) {
  const auto sinks = Registry::instance().sinks();
  if (sinks->empty())
    return;
  Record record{std::chrono::system_clock::now(),
                level,
                category.name(),
                qualifiedFunctionName(prettyFunction),
                std::move(message),
                file,
                line};
  for (const auto& sink : *sinks)
    sink->consume(record);
}

void CapturingSink::consume(const Record& record) {
  std::lock_guard lock(mutex_);
  records_.push_back(record);
}

std::vector<Record> CapturingSink::records() const {
  std::lock_guard lock(mutex_);
  return records_;
}

bool CapturingSink::contains(std::string_view category, Level level,
                             std::string_view message) const {
  std::lock_guard lock(mutex_);
  return std::any_of(records_.begin(), records_.end(), [&](const Record& r) {
    return r.category == category && r.level == level && r.message == message;
  });
}

bool CapturingSink::containsPart(std::string_view category, Level level,
                                 std::string_view part) const {
  std::lock_guard lock(mutex_);
  return std::any_of(records_.begin(), records_.end(), [&](const Record& r) {
    return r.category == category && r.level == level && r.message.find(part) != std::string::npos;
  });
}

std::size_t CapturingSink::count() const {
  std::lock_guard lock(mutex_);
  return records_.size();
}

void CapturingSink::clear() {
  std::lock_guard lock(mutex_);
  records_.clear();
}

struct ScopedCapture::Saved {
  std::vector<Rule> rules;
};

ScopedCapture::ScopedCapture(Level level, bool quiet)
    : sink_(std::make_shared<CapturingSink>()),
      saved_(std::make_unique<Saved>(Saved{Registry::instance().rules()})),
      quiet_(quiet) {
  auto rules = saved_->rules;
  rules.insert(rules.begin(), Rule{"*", level});
  Registry::instance().replaceRules(std::move(rules));
  if (quiet_)
    setDefaultSinkEnabled(false);
  addSink(sink_);
}

ScopedCapture::~ScopedCapture() {
  removeSink(sink_);
  if (quiet_)
    setDefaultSinkEnabled(true);
  Registry::instance().replaceRules(std::move(saved_->rules));
}

}  // namespace ko::log
