// mokuto methods | tags | animations [TAG] | sounds | diagnosis | page: what the service
// and the simulated robot offer, asked of the service embedded in the process (on the
// timing speech engine, once its animation index is built) or, with mokuto --connect, of
// the running one (sounds excepted: it reads this machine's sound library).
#include <filesystem>
#include <iostream>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "cli_commands.h"
#include "cli_common.h"
#include "cli_json.h"
#include "cli_service.h"
#include "ko/log.hpp"
#include "ko/os.hpp"
#include "ko/path.hpp"
#include "robotsim/soundlibrary.h"
#include "zu/enums.h"
#include "zu/zuerror.h"

namespace mokuto::cli {

namespace {

namespace fs = std::filesystem;

constexpr const char* kDefaultPackage = "animations/";

struct InspectOptions {
  std::string posture;
  std::vector<std::string> packages;
  std::string tag;
};

// A command's own error: its message, and status 1.
class NotFound : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

Json methodsToJson(ServiceHandle& service) {
  Json methods = Json::array();
  for (const auto& info : service.getMethodInfos()) {
    Json parameters = Json::array();
    for (const auto& parameter : info.parameters)
      parameters.push_back({{"name", parameter.name}, {"description", parameter.description}});
    Json method;
    method["name"] = info.name;
    method["description"] = info.description;
    method["parameters"] = std::move(parameters);
    method["signature"] = info.parametersSignature;
    method["return"] = info.returnValue ? Json{{"name", info.returnValue->name},
                                               {"description", info.returnValue->description},
                                               {"signature", info.returnSignature}}
                                        : Json();
    methods.push_back(std::move(method));
  }
  return methods;
}

// Whether `path` is an animation for the posture family `posture` ("Standing", ...): the
// folder after one of the packages names it. No posture: every path.
bool madeFor(const std::string& path, const InspectOptions& o) {
  if (o.posture.empty())
    return true;
  const std::string folder =
      std::string(ZU::kPostureFamilyFolders[ZU::postureFamilyFromStr(o.posture)]) + "/";
  std::vector<std::string> packages = {kDefaultPackage};
  for (const auto& package : o.packages)
    packages.push_back(package + "/");
  for (const auto& package : packages) {
    if (path.rfind(package, 0) == 0 && path.compare(package.size(), folder.size(), folder) == 0)
      return true;
  }
  return false;
}

std::vector<std::string> animationsOfTag(ServiceHandle& service, const std::string& tag,
                                         const InspectOptions& o) {
  std::vector<std::string> animations;
  for (const auto& animation : service._getAnimationsByTag(tag)) {
    if (madeFor(animation, o))
      animations.push_back(animation);
  }
  return animations;
}

void printTags(ServiceHandle& service, const InspectOptions& o) {
  for (const auto& tag : service._getTagList()) {
    if (o.posture.empty() || !animationsOfTag(service, tag, o).empty())
      std::cout << tag << '\n';
  }
}

void printAnimations(ServiceHandle& service, const InspectOptions& o) {
  const std::string posture = o.posture.empty() ? "" : " for the " + o.posture + " posture";
  if (!o.tag.empty()) {
    const auto animations = animationsOfTag(service, o.tag, o);
    if (animations.empty())
      throw NotFound("no animation for the tag \"" + o.tag + "\"" + posture);
    for (const auto& animation : animations)
      std::cout << animation << '\n';
    return;
  }
  // Every behaviour that a text can start by its path.
  std::size_t count = 0;
  for (const auto& path : service.installedBehaviors()) {
    if (madeFor(path, o)) {
      std::cout << path << '\n';
      ++count;
    }
  }
  if (count == 0)
    throw NotFound("no animation" + posture);
}

// Runs `body` on the service, embedded or running; the exit status.
template <class Body>
int withService(const char* command, const InspectOptions& o, Body&& body) {
  if (ko::os::getenv("ZEFOKO_LOG").empty())
    ko::log::setLevels("*=warning");
  const bool filter = std::string(command) == "tags" || std::string(command) == "animations";
  if (connected() && !o.posture.empty() && !filter) {
    std::cerr << "mokuto " << command
              << ": --posture belongs to the robot's process with --connect (zefoko serve "
                 "--listen)"
              << std::endl;
    return kUsage;
  }
  try {
    EmbeddedServiceOptions options;
    options.speech = "timing";
    options.posture = o.posture;
    const std::unique_ptr<ServiceHandle> service = openService(options);
    for (const auto& package : o.packages)
      service->declareAnimationsPackage(package);
    body(*service);
  } catch (const ServiceError& e) {
    std::cerr << "mokuto " << command << ": the service cannot start: " << e.what() << std::endl;
    return kFailure;
  } catch (const ZU::ZUError& e) {
    std::cerr << "mokuto " << command << ": " << e.description() << std::endl;
    return kFailure;
  } catch (const std::exception& e) {
    std::cerr << "mokuto " << command << ": " << e.what() << std::endl;
    return kFailure;
  }
  return std::cout.flush().good() ? kSuccess : kFailure;
}

void addInspectCommand(CLI::App& app, int& status, const char* name, const char* help,
                       bool withLibraryOptions,
                       void (*run)(ServiceHandle&, const InspectOptions&)) {
  auto o = std::make_shared<InspectOptions>();
  CLI::App* command = app.add_subcommand(name, help);
  if (withLibraryOptions) {
    command
        ->add_option("--posture", o->posture,
                     std::string(name) == "tags" || std::string(name) == "animations"
                         ? "Only what is made for this posture family (default: every posture)"
                         : "The robot's posture family (default: Standing, the robot's own)")
        ->check(CLI::IsMember({"Standing", "Sitting", "SittingOnChair"}));
    command
        ->add_option("--package", o->packages,
                     "An animations package to declare first, as declareAnimationsPackage "
                     "takes it (repeatable; default: only \"animations/\")")
        ->type_name("NAME")
        ->allow_extra_args(false);
  }
  if (std::string(name) == "animations")
    command->add_option("tag", o->tag, "The tag (default: none, every animation)");
  command->callback([o, name, run, &status] {
    status = withService(name, *o, [&o, run](ServiceHandle& service) { run(service, *o); });
  });
}

// The sound sets of the robot's library: every folder under the sounds root that holds a
// sound, by its path from the root.
int printSounds() {
  const std::string root = ko::path::findData("zefoko", "sounds");
  if (root.empty()) {
    std::cerr << "mokuto sounds: no sound library (zefoko/sounds)" << std::endl;
    return kFailure;
  }
  std::set<std::string> sounds;
  std::error_code error;
  for (auto it = fs::recursive_directory_iterator(root, error);
       !error && it != fs::recursive_directory_iterator(); it.increment(error)) {
    if (!it->is_directory(error))
      continue;
    try {
      const std::string set = fs::relative(it->path(), root).generic_string();
      for (const auto& [name, file] : robotsim::readSoundSet(it->path()).files)
        sounds.insert(set + "/" + name);
    } catch (const robotsim::SoundFileError&) {
    }
  }
  if (sounds.empty()) {
    std::cerr << "mokuto sounds: no sound in " << root << std::endl;
    return kFailure;
  }
  for (const auto& sound : sounds)
    std::cout << sound << '\n';
  return std::cout.flush().good() ? kSuccess : kFailure;
}

}  // namespace

void addInspectCommands(CLI::App& app, int& status) {
  addInspectCommand(app, status, "methods",
                    "Print the service's published methods as JSON, in binding order, the "
                    "built-in ones included",
                    false, [](ServiceHandle& service, const InspectOptions&) {
                      std::cout << dumpJson(methodsToJson(service)) << std::endl;
                    });
  addInspectCommand(
      app, status, "tags",
      "Print the tags that the service knows, one a line (as _getTagList), those with an "
      "animation for the posture with --posture",
      true, printTags);
  addInspectCommand(app, status, "animations",
                    "Print the animations bound to a tag, one a line (as _getAnimationsByTag), "
                    "or without a tag every animation that a text can start; status 1 when "
                    "there is none",
                    true, printAnimations);
  addInspectCommand(app, status, "diagnosis",
                    "Print the service's diagnosis lines (as _diagnosis logs them)", true,
                    [](ServiceHandle& service, const InspectOptions&) {
                      for (const auto& line : service.diagnosisLines())
                        std::cout << line << '\n';
                    });
  addInspectCommand(
      app, status, "page", "Print the service's tag page (HTML, as httpGet answers it)", true,
      [](ServiceHandle& service, const InspectOptions&) { std::cout << service.tagPage(); });
  CLI::App* sounds = app.add_subcommand(
      "sounds", "Print the robot's sounds as a text names them (SET/NAME), one a line");
  sounds->callback([&status] { status = printSounds(); });
}

}  // namespace mokuto::cli
