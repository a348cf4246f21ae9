// xtctl: looks at a running daemon from a terminal.
#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <memory>
#include <string_view>
#include <vector>

#include "platform/log/Log.h"
#include "tools/AccessCommand.h"
#include "tools/AnnotateCommand.h"
#include "tools/ElectCommand.h"
#include "tools/ElectionsCommand.h"
#include "tools/ExclusionsCommand.h"
#include "tools/FindCommand.h"
#include "tools/HoldCommand.h"
#include "tools/LintCommand.h"
#include "tools/MatchCommand.h"
#include "tools/ReadyCommand.h"
#include "tools/RegistrationCommand.h"
#include "tools/ReleaseCommand.h"
#include "tools/RunCommand.h"
#include "tools/WatchCommand.h"
#include "tools/WhyCommand.h"

namespace {

constexpr const char* kAbout = R"(Looks at, and decides about, the plug-ins that a running xtd knows and offers.)";

constexpr const char* kFooter = R"(`xtctl COMMAND --help` says more about a command.

Exit status
  0  done                                  2  the command line is wrong
  1  the daemon refused; it says why       3  no daemon answers; it says where

Environment
  EXTORA_RUNTIME_DIR  where the daemon's socket is; without it the user's own instance is
                      asked if there is one, else the system's (/run/extora)
  EXTORA_LOG          log level on standard error: debug, info, default, error or fault)";

int run(int argc, char** argv) {
  using tools::ExitStatus;
  CLI::App app(kAbout, "xtctl");
  app.footer(kFooter);
  app.set_version_flag("--version", "xtctl " EXTORA_VERSION, "Print the version and exit");
  app.require_subcommand(0, 1);
  app.get_formatter()->column_width(26);
  std::string service(extora::XTDDefaultServiceName);
  app.add_option("--service", service, "Ask the daemon of this name, if not " + service)->option_text("NAME");

  std::vector<std::unique_ptr<tools::Command>> commands;
  commands.push_back(std::make_unique<tools::MatchCommand>());
  commands.push_back(std::make_unique<tools::FindCommand>());
  commands.push_back(std::make_unique<tools::WhyCommand>());
  commands.push_back(std::make_unique<tools::WatchCommand>());
  commands.push_back(std::make_unique<tools::ElectCommand>());
  commands.push_back(std::make_unique<tools::ElectionsCommand>());
  commands.push_back(std::make_unique<tools::AnnotateCommand>());
  commands.push_back(std::make_unique<tools::ExclusionsCommand>());
  commands.push_back(std::make_unique<tools::ReadyCommand>());
  commands.push_back(std::make_unique<tools::AccessCommand>());
  commands.push_back(std::make_unique<tools::RunCommand>());
  commands.push_back(std::make_unique<tools::HoldCommand>());
  commands.push_back(std::make_unique<tools::ReleaseCommand>());
  commands.push_back(std::make_unique<tools::RegistrationCommand>(tools::RegistrationCommand::Kind::Add));
  commands.push_back(std::make_unique<tools::RegistrationCommand>(tools::RegistrationCommand::Kind::Remove));
  commands.push_back(std::make_unique<tools::LintCommand>());
  std::vector<CLI::App*> parsers;
  for (const auto& command : commands) parsers.push_back(command->addTo(app));
  for (CLI::App* parser : parsers) parser->fallthrough();  // --service may stand behind the command too

  char** const end = argv + argc;
  char** const mark = std::find_if(argv, end, [](const char* word) { return std::string_view(word) == "--"; });
  try {
    app.parse(static_cast<int>(mark - argv), argv);
    if (app.get_subcommands().empty()) throw CLI::RequiredError("A command");
    for (std::size_t i = 0; i < commands.size() && mark != end; ++i) {
      if (parsers[i]->parsed() && !commands[i]->takeWords({mark + 1, end})) {
        throw CLI::ValidationError("--", parsers[i]->get_name() + " takes nothing behind it");
      }
    }
  } catch (const CLI::ParseError& error) {
    if (error.get_exit_code() == 0) return app.exit(error);  // --help, --version
    tools::complain(error.what());
    std::fputs("Run `xtctl --help` for the commands, `xtctl COMMAND --help` for the options of one.\n", stderr);
    return static_cast<int>(ExitStatus::Usage);
  }

  // The tool itself says what went wrong; the log is for those who ask for it.
  if (std::getenv("EXTORA_LOG") == nullptr) platform::Log::configure("fault");
  tools::DaemonSession daemon(service);
  std::string out;
  auto status = ExitStatus::Usage;
  for (std::size_t i = 0; i < commands.size(); ++i) {
    if (parsers[i]->parsed()) status = commands[i]->run(daemon, out);
  }
  if (std::fwrite(out.data(), 1, out.size(), stdout) != out.size() || std::fflush(stdout) != 0) {
    tools::complain("the answer could not be written");
    if (status == ExitStatus::Success) status = ExitStatus::Refused;
  }
  return static_cast<int>(status);
}

}  // namespace

int main(int argc, char** argv) {
  try {
    return run(argc, argv);
  } catch (const std::exception& fault) {  // a broken contract: of this program, or of a daemon that answers nonsense
    std::fprintf(stderr, "xtctl: internal fault: %s\n", fault.what());
    return static_cast<int>(tools::ExitStatus::Refused);
  }
}
