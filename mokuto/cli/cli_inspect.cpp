// mokuto methods | tags | animations TAG | diagnosis | page: what the service publishes,
// asked of the service embedded in the process (on the timing speech engine, once its
// animation index is built).
#include <iostream>
#include <memory>
#include <string>
#include <vector>

#include "cli_commands.h"
#include "cli_json.h"
#include "cli_service.h"
#include "ko/log.hpp"
#include "ko/os.hpp"
#include "zu/zuerror.h"

namespace mokuto::cli {

namespace {

struct InspectOptions {
  std::string posture;
  std::vector<std::string> packages;
  std::string tag;
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

// Runs `body` on the embedded service; the exit status.
template <class Body>
int withService(const char* command, const InspectOptions& o, Body&& body) {
  if (ko::os::getenv("ZEFOKO_LOG").empty())
    ko::log::setLevels("*=warning");
  try {
    EmbeddedServiceOptions options;
    options.speech = "timing";
    options.posture = o.posture;
    const std::unique_ptr<ServiceHandle> embedded = openService(options);
    for (const auto& package : o.packages)
      embedded->declareAnimationsPackage(package);
    body(*embedded);
  } catch (const ServiceError& e) {
    std::cerr << "mokuto " << command << ": the service cannot start: " << e.what() << std::endl;
    return 1;
  } catch (const ZU::ZUError& e) {
    std::cerr << "mokuto " << command << ": " << e.description() << std::endl;
    return 1;
  } catch (const std::exception& e) {
    std::cerr << "mokuto " << command << ": " << e.what() << std::endl;
    return 1;
  }
  return std::cout.good() ? 0 : 1;
}

CLI::App* addInspectCommand(CLI::App& app, int& status, const char* name, const char* help,
                            bool withLibraryOptions,
                            void (*run)(ServiceHandle&, const InspectOptions&)) {
  auto o = std::make_shared<InspectOptions>();
  CLI::App* command = app.add_subcommand(name, help);
  if (withLibraryOptions) {
    command
        ->add_option("--posture", o->posture,
                     "The robot's posture family (default: the robot's own)")
        ->check(CLI::IsMember({"Standing", "Sitting", "SittingOnChair"}));
    command
        ->add_option("--package", o->packages,
                     "An animations package to declare first (repeatable)")
        ->type_name("NAME");
  }
  if (std::string(name) == "animations")
    command->add_option("tag", o->tag, "The tag")->required();
  command->callback([o, name, run, &status] {
    status = withService(name, *o, [&o, run](ServiceHandle& service) { run(service, *o); });
  });
  return command;
}

}  // namespace

void addInspectCommands(CLI::App& app, int& status) {
  addInspectCommand(app, status, "methods",
                    "Print the service's published methods as JSON, in binding order, the "
                    "built-in ones included",
                    false, [](ServiceHandle& service, const InspectOptions&) {
                      std::cout << dumpJson(methodsToJson(service)) << std::endl;
                    });
  addInspectCommand(app, status, "tags",
                    "Print the tags that the service knows, one a line (as _getTagList)", true,
                    [](ServiceHandle& service, const InspectOptions&) {
                      for (const auto& tag : service._getTagList())
                        std::cout << tag << '\n';
                    });
  addInspectCommand(app, status, "animations",
                    "Print the animations bound to a tag, one a line (as _getAnimationsByTag)",
                    true, [](ServiceHandle& service, const InspectOptions& o) {
                      for (const auto& animation : service._getAnimationsByTag(o.tag))
                        std::cout << animation << '\n';
                    });
  addInspectCommand(app, status, "diagnosis",
                    "Print the service's diagnosis lines (as _diagnosis logs them)", true,
                    [](ServiceHandle& service, const InspectOptions&) {
                      for (const auto& line : service.diagnosisLines())
                        std::cout << line << '\n';
                    });
  addInspectCommand(
      app, status, "page", "Print the service's tag page (HTML, as httpGet answers it)", true,
      [](ServiceHandle& service, const InspectOptions&) { std::cout << service.tagPage(); });
}

}  // namespace mokuto::cli
