// zefoko keys DIR [--name NAME]: makes a CURVE key pair for the links between processes:
// DIR/NAME.secret (readable by its owner only) and DIR/NAME.public.
#include <filesystem>
#include <iostream>
#include <string>

#include "commands.h"
#include "ko/remote.hpp"

namespace zefoko {

void addKeysCommand(CLI::App& app, int& status) {
  auto folder = std::make_shared<std::string>();
  auto name = std::make_shared<std::string>("zefoko");
  auto force = std::make_shared<bool>(false);
  CLI::App* command = app.add_subcommand(
      "keys",
      "Make a CURVE key pair for a link between processes: the listening process takes its "
      "secret key (serve --secret-key) and its clients' public keys (--client-key); a "
      "connecting one its own secret key and the listening one's public key (--server-key)");
  command->add_option("folder", *folder, "Where to write NAME.secret and NAME.public")
      ->required()
      ->check(CLI::ExistingDirectory);
  command->add_option("--name", *name, "The files' name")->capture_default_str();
  command->add_flag("--force", *force, "Replace existing files");
  command->callback([folder, name, force, &status] {
    const std::filesystem::path base = std::filesystem::path(*folder) / *name;
    const std::string secret = base.string() + ".secret";
    const std::string pub = base.string() + ".public";
    if (!*force && (std::filesystem::exists(secret) || std::filesystem::exists(pub))) {
      std::cerr << "zefoko keys: " << secret << " or " << pub
                << " exists already (--force replaces them)" << std::endl;
      status = 2;
      return;
    }
    try {
      const auto pair = ko::remote::makeKeyPair();
      ko::remote::writeKeyFile(secret, pair.secretKey, true);
      ko::remote::writeKeyFile(pub, pair.publicKey, false);
      std::cout << "zefoko keys: wrote " << secret << " and " << pub << std::endl;
    } catch (const std::exception& e) {
      std::cerr << "zefoko keys: " << e.what() << std::endl;
      status = 1;
    }
  });
}

}  // namespace zefoko
