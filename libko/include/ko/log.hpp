#pragma once
// Logging with named categories.
//
// Every line carries its category ("mokuto.parser"), its level and the qualified name
// of the function that logs ("ZU::MokutoConfig::fromZUValue"). Levels follow the
// framework's numbering: 0 silent, 1 fatal, 2 error, 3 warning, 4 info, 5 verbose,
// 6 debug; a category logs the lines whose level is at or below its own.
//
// Levels are set per category by glob rules ("mokuto.*=verbose,*=warning"): from the
// environment variable ZEFOKO_LOG when the first category is created, and at run time
// through setLevel/setLevels. The first rule that matches a category gives its level;
// a rule set at run time goes before the older ones. Categories that no rule matches
// log at info.
//
// The macros test the category's level before anything is formatted, so a disabled
// line costs one relaxed atomic load. All functions are thread-safe; sinks are called
// under no lock of ours, from the logging thread, and must be thread-safe themselves.

#include <atomic>
#include <chrono>
#include <memory>
#include <mutex>
#include <sstream>
#include <string>
#include <string_view>
#include <vector>

namespace ko::log {

enum Level : int {
  Silent = 0,
  Fatal = 1,
  Error = 2,
  Warning = 3,
  Info = 4,
  Verbose = 5,
  Debug = 6,
};

const char* levelName(Level level) noexcept;
// Parses "warning", "verbose", ... or a digit 0 to 6; returns false when unknown.
bool parseLevel(std::string_view text, Level& out) noexcept;

class Category {
 public:
  explicit Category(std::string name, Level level) : name_(std::move(name)), level_(level) {}
  const std::string& name() const noexcept { return name_; }
  Level level() const noexcept {
    return static_cast<Level>(level_.load(std::memory_order_relaxed));
  }
  bool enabled(Level l) const noexcept {
    return static_cast<int>(l) <= level_.load(std::memory_order_relaxed);
  }
  void setLevel(Level l) noexcept { level_.store(static_cast<int>(l), std::memory_order_relaxed); }

 private:
  std::string name_;
  std::atomic<int> level_;
};

// The category of that name, created on first use; the reference stays valid for the
// life of the process.
Category& category(std::string_view name);

// Adds a rule in front of the existing ones and applies it to every category.
void setLevel(std::string_view pattern, Level level);
// Parses "pattern=level,pattern=level"; the rules keep their written order and go in
// front of the existing ones. Returns false (and changes nothing) on a malformed spec.
bool setLevels(std::string_view spec);
// Drops every rule (the environment's included): all categories log at info.
void resetLevels();
// Whether `pattern` (with '*' as wildcard) matches `name`.
bool globMatch(std::string_view pattern, std::string_view name) noexcept;

struct Record {
  std::chrono::system_clock::time_point time;
  Level level;
  std::string category;
  std::string function;  // qualified name, "ZU::ZUMokuto::xSay"
  std::string message;
  const char* file;
  int line;
};

class Sink {
 public:
  virtual ~Sink() = default;
  virtual void consume(const Record& record) = 0;
};

// Sinks receive every line that passes its category's level. The default sink writes
// to standard error through spdlog; it can be removed (for example by a test).
void addSink(std::shared_ptr<Sink> sink);
void removeSink(const std::shared_ptr<Sink>& sink);
void setDefaultSinkEnabled(bool enabled);

// A sink that keeps lines in memory, for tests. Registers itself on construction when
// asked to and unregisters on destruction.
class CapturingSink : public Sink, public std::enable_shared_from_this<CapturingSink> {
 public:
  void consume(const Record& record) override;
  std::vector<Record> records() const;
  // Whether a line of that category and level has exactly this message.
  bool contains(std::string_view category, Level level, std::string_view message) const;
  // Whether a line of that category and level contains this text.
  bool containsPart(std::string_view category, Level level, std::string_view part) const;
  std::size_t count() const;
  void clear();

 private:
  mutable std::mutex mutex_;
  std::vector<Record> records_;
};

// For tests: installs a CapturingSink for the life of the guard, with every category
// raised to `level`; `quiet` mutes the standard-error sink meanwhile. The previous
// level rules come back on destruction. One guard at a time.
class ScopedCapture {
 public:
  explicit ScopedCapture(Level level = Debug, bool quiet = true);
  ~ScopedCapture();
  ScopedCapture(const ScopedCapture&) = delete;
  ScopedCapture& operator=(const ScopedCapture&) = delete;
  CapturingSink& sink() { return *sink_; }
  CapturingSink* operator->() { return sink_.get(); }

 private:
  struct Saved;
  std::shared_ptr<CapturingSink> sink_;
  std::unique_ptr<Saved> saved_;
  bool quiet_;
};

// "void ZU::MokutoConfig::fromZUValue(const ZU::ZUValue&)" -> "ZU::MokutoConfig::fromZUValue"
std::string qualifiedFunctionName(std::string_view prettyFunction);

void write(const Category& category, Level level, std::string_view prettyFunction,
           std::string message, const char* file, int line);

// Collects one line; emits it on destruction.
class LineStream {
 public:
  LineStream(const Category& category, Level level, const char* prettyFunction, const char* file,
             int line)
      : category_(category), level_(level), function_(prettyFunction), file_(file), line_(line) {}
  ~LineStream() { write(category_, level_, function_, stream_.str(), file_, line_); }
  LineStream(const LineStream&) = delete;
  LineStream& operator=(const LineStream&) = delete;
  std::ostream& stream() { return stream_; }

 private:
  const Category& category_;
  Level level_;
  const char* function_;
  const char* file_;
  int line_;
  std::ostringstream stream_;
};

}  // namespace ko::log

// The category of a literal name, looked up once per call site.
#define KO_CATEGORY(name)                                                \
  ([]() -> ::ko::log::Category& {                                        \
    static ::ko::log::Category& koCategory_ = ::ko::log::category(name); \
    return koCategory_;                                                  \
  }())

#define KO_LOG(name, lvl)                                                            \
  if (::ko::log::Category& koLogCat_ = KO_CATEGORY(name); !koLogCat_.enabled(lvl)) { \
  } else                                                                             \
    ::ko::log::LineStream(koLogCat_, lvl, __PRETTY_FUNCTION__, __FILE__, __LINE__).stream()

#define KO_LOG_FATAL(name) KO_LOG(name, ::ko::log::Fatal)
#define KO_LOG_ERROR(name) KO_LOG(name, ::ko::log::Error)
#define KO_LOG_WARNING(name) KO_LOG(name, ::ko::log::Warning)
#define KO_LOG_INFO(name) KO_LOG(name, ::ko::log::Info)
#define KO_LOG_VERBOSE(name) KO_LOG(name, ::ko::log::Verbose)
#define KO_LOG_DEBUG(name) KO_LOG(name, ::ko::log::Debug)
