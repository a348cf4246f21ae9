// xtd: the plug-in broker. Parses its options, builds the one server and runs it until SIGTERM.
#include <malloc.h>
#include <systemd/sd-daemon.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <exception>

#include "Extora/XTLog.h"
#include "Extora/XTProtocol.h"
#include "platform/Platform.h"
#include "platform/hostservices/HostServices.h"
#include "platform/queue/MainRunLoop.h"
#include "xtd/XTDServer.h"

namespace {

using platform::MainRunLoop;

// Exit statuses; after SIGTERM it is 0.
constexpr int kCannotServe = 1;
constexpr int kUsage = 2;

// Bytes: what the heap keeps of what is freed, and takes from the system at a time.
constexpr int kKeptHeap = 32 << 20;
constexpr int kHeapStep = 1 << 20;

struct Options {
  std::uint32_t cacheLimit = 1000000;
  std::optional<std::string> databasePath;
  std::string serviceName{extora::XTDDefaultServiceName};
  std::uint32_t verbose = 0;
};

[[noreturn]] void usage() {
  std::fputs("Usage: xtd [-S servicename] [-v]\n", stderr);
  std::exit(kUsage);
}

Options parse(int argc, char* argv[]) {
  Options options;
  for (int option = 0; (option = getopt(argc, argv, "c:d:S:v")) != -1;) {
    switch (option) {
      case 'c':
        options.cacheLimit = static_cast<std::uint32_t>(std::atoi(optarg));
        break;
      case 'd':
        options.databasePath = optarg;
        break;
      case 'S':
        options.serviceName = optarg;
        break;
      case 'v':
        ++options.verbose;
        platform::Log::processDefault().error(
            "verbose option -v is ineffective; use log config --subsystem com.orvane.extora");
        break;
      case '?':
        usage();
      default:
        break;
    }
  }
  if (optind < argc) usage();
  return options;
}

// A broken contract, whichever thread it was found on, is written down before the process aborts.
[[noreturn]] void logAndAbort() {
  try {
    if (const auto current = std::current_exception()) std::rethrow_exception(current);
  } catch (const std::exception& exception) {
    extora::XTLogOps().fault("{}", exception.what());
  } catch (...) {
    extora::XTLogOps().fault("unknown exception");
  }
  platform::Log::flush();
  std::abort();
}

std::shared_ptr<extora::XTDServer> makeServer(const Options& options) {
  platform::Error error;
  auto platform = platform::Platform::make(platform::Directories::current(), &error);
  if (platform == nullptr) {
    extora::XTLogOps().error("{}", error);
    return nullptr;
  }
  return extora::XTDServer::initForService(std::move(platform), options.serviceName, options.databasePath);
}

}  // namespace

// A large reply is built of some megabytes in small pieces. Kept by the heap they cost half as much the next time,
// since the first touch of fresh memory is dear; the IPC layer gives them back when the daemon has been idle.
void keepHeap() {
  ::mallopt(M_TRIM_THRESHOLD, kKeptHeap);
  ::mallopt(M_MMAP_THRESHOLD, kKeptHeap);
  ::mallopt(M_TOP_PAD, kHeapStep);
}

int main(int argc, char* argv[]) {
  MainRunLoop::blockSignals();
  keepHeap();
  std::set_terminate(logAndAbort);
  extora::XTLogOps().info("xtd is launching");
  const Options options = parse(argc, argv);
  const auto server = makeServer(options);
  if (server == nullptr) {
    extora::XTLogOps().error("unable to construct server");
    MainRunLoop::exitProcess(kCannotServe);
  }
  server->setVerbose(options.verbose);
  server->setCacheLimit(options.cacheLimit);
  const auto& platform = *server->platformServices();
  const auto hostServices = platform::HostServices::make({platform.directories, platform.jobs, platform.sandbox});
  if (hostServices != nullptr) hostServices->resume();
  // Runs once the loop does: the listener has been resumed by then.
  MainRunLoop::main().async([] { (void)sd_notify(0, "READY=1"); });
  server->run();
  return 0;
}
