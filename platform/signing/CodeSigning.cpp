// How the entitlements of a process are found:
//
// 1. Open every directory from "/" to its executable; the executable must be the file that the process ran at accept.
// 2. The nearest of these directories that holds an Info.plist is its bundle; without one the file beside it counts.
// 3. No entitlements file: nothing. Else everything opened on the way, and that file, must satisfy the rule of trust.
// 4. Read it, and look at the process again: what was read counts only while it is alive and runs that executable.
#include "platform/signing/CodeSigning.h"

#include <sys/stat.h>

#include <algorithm>
#include <atomic>
#include <utility>

#include "platform/files/DamagedFileLog.h"
#include "platform/files/Files.h"
#include "platform/log/Log.h"
#include "platform/signing/TrustWalk.h"

namespace platform {
namespace {

using Item = TrustWalk::Item;

constexpr const char* kInfoName = "Info.plist";
constexpr const char* kEntitlementsName = "Entitlements.plist";

struct PathParts {
  std::string directory;
  std::string name;
};

PathParts partsOf(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  if (slash == std::string::npos) return {".", path};
  return {slash == 0 ? "/" : path.substr(0, slash), path.substr(slash + 1)};
}

// The first problem of several items, of which some may be absent.
std::optional<Error> firstProblem(std::initializer_list<const std::optional<Item>*> items) {
  for (const auto* item : items) {
    if (*item && (*item)->problem) return (*item)->problem;
  }
  return std::nullopt;
}

// The entitlements of a process.
struct Answer {
  Value entitlements;
  std::optional<Error> error;
  bool refused = false;  // by the rule of trust
};

// What holds an Info.plist, nearest first; null when nothing does. The root directory is no bundle.
const Item* bundleOf(const TrustWalk& walk) {
  const auto& all = walk.directories();
  const auto found = std::find_if(all.rbegin(), all.rend() - 1, [](const Item& directory) {
    const auto info = TrustWalk::open(directory, kInfoName, nullptr);
    return info && !S_ISDIR(info->status.st_mode);
  });
  return found == all.rend() - 1 ? nullptr : &*found;
}

Answer entitlementsOfPeer(const PeerIdentity& peer) {
  const PathParts parts = partsOf(peer.executablePath());
  if (parts.name.empty()) return {};
  const auto walk = TrustWalk::to(parts.directory, nullptr);
  if (!walk) return {};
  const std::optional<Item> executable = TrustWalk::openFile(walk->directories().back(), parts.name, nullptr);
  if (!executable || executable->status.st_dev != peer.executableDevice() ||
      executable->status.st_ino != peer.executableInode()) {
    return {};
  }

  const Item* bundle = bundleOf(*walk);
  Error missing;
  const std::optional<Item> info = bundle ? TrustWalk::openFile(*bundle, kInfoName, nullptr) : std::nullopt;
  const std::optional<Item> file =
      bundle ? TrustWalk::openFile(*bundle, kEntitlementsName, &missing)
             : TrustWalk::openFile(walk->directories().back(), parts.name + ".entitlements", &missing);
  Answer answer;
  if (!file) {
    if (missing.code != kFileDoesNotExist) answer.error = missing;
  } else if ((answer.error = walk->problem()) || (answer.error = firstProblem({&executable, &info, &file}))) {
    answer.refused = true;
  } else {
    Error error;
    answer.entitlements = readDictionary(*file, &error);
    if (!answer.entitlements) {
      DamagedFileLog::shared().report(file->path, FileState::of(file->status), error.describe());
      answer.error = std::move(error);
    }
  }
  return peer.executableUnchanged() && peer.isAlive() ? answer : Answer();
}

class PeerTask : public CodeSigningTask {
 public:
  explicit PeerTask(std::shared_ptr<const PeerIdentity> peer) : peer_(std::move(peer)) {}

  Value copyEntitlementValue(const std::string& name, Error* error) override {
    const bool first = !asked_.exchange(true);
    if (refused_.load()) return {};
    Answer answer = entitlementsOfPeer(*peer_);
    if (answer.refused) refused_.store(true);
    if (answer.error && first) {
      Log::processDefault().debug("entitlements of process {} do not count: {}", peer_->pid(), *answer.error);
      setError(error, std::move(*answer.error));
    }
    return answer.entitlements[name];
  }

 private:
  const std::shared_ptr<const PeerIdentity> peer_;
  std::atomic<bool> asked_{false};
  std::atomic<bool> refused_{false};
};

class FileCodeSigning : public CodeSigning {
 public:
  std::shared_ptr<CodeSigningTask> taskForAuditToken(const std::shared_ptr<const PeerIdentity>& peer) override {
    return peer != nullptr && peer->isAlive() ? std::make_shared<PeerTask>(peer) : nullptr;
  }
};

// The problem of the executable that `info` names, if it names one and there is one.
std::optional<Error> executableProblem(TrustWalk& walk, const Value& info) {
  PathParts parts = partsOf(info["HBBundleExecutable"].string());
  if (parts.name.empty()) return std::nullopt;
  Error error;
  std::string_view rest = parts.directory;
  while (!rest.empty()) {
    const std::size_t slash = std::min(rest.find('/'), rest.size());
    const std::string name(rest.substr(0, slash));
    rest.remove_prefix(std::min(slash + 1, rest.size()));
    if (name.empty() || name == ".") continue;
    if (name == "..") return Error{"POSIX", EPERM, walk.directories().back().path + ": its executable is not below it"};
    if (!walk.descend(name, &error)) return error.code == kFileDoesNotExist ? std::nullopt : std::optional(error);
  }
  const std::optional<Item> executable = TrustWalk::openFile(walk.directories().back(), parts.name, &error);
  if (!executable) return error.code == kFileDoesNotExist ? std::nullopt : std::optional(error);
  if (auto problem = walk.problem()) return problem;
  return executable->problem;
}

// Judges the bundle that `walk` leads to, its entitlements file being `entitlements` if it has one.
std::optional<Error> problemOfBundle(TrustWalk& walk, const std::optional<Item>& entitlements) {
  if (auto problem = walk.problem()) return problem;
  Error error;
  const std::optional<Item> info = TrustWalk::openFile(walk.directories().back(), kInfoName, &error);
  if (!info) return error;
  if (auto problem = firstProblem({&info, &entitlements})) return problem;
  const Value dictionary = readDictionary(*info, &error);
  if (!dictionary) return error;
  return executableProblem(walk, dictionary);
}

}  // namespace

std::shared_ptr<CodeSigning> CodeSigning::make() {
  return std::make_shared<FileCodeSigning>();
}

std::optional<Error> trustProblem(const std::string& path) {
  std::string plain = path;
  while (plain.size() > 1 && plain.ends_with('/')) plain.pop_back();
  const PathParts parts = partsOf(plain);
  const bool isPlace = parts.name.empty() || parts.name == "." || parts.name == "..";
  Error error;
  const auto walk = TrustWalk::to(isPlace ? plain : parts.directory, &error);
  if (!walk) return error;
  if (auto problem = walk->problem(); problem || isPlace) return problem;
  const std::optional<Item> item = TrustWalk::open(walk->directories().back(), parts.name, &error);
  return item ? item->problem : error;
}

std::optional<Error> bundleTrustProblem(const std::string& bundlePath) {
  Error error;
  auto walk = TrustWalk::to(bundlePath, &error);
  if (!walk) return error;
  const auto entitlements = TrustWalk::openFile(walk->directories().back(), kEntitlementsName, &error);
  if (!entitlements && error.code != kFileDoesNotExist) return error;
  return problemOfBundle(*walk, entitlements);
}

Value entitlementsOfBundle(const std::string& bundlePath, Error* error) {
  auto walk = TrustWalk::to(bundlePath, error);
  if (!walk) return {};
  Error problem;
  const auto file = TrustWalk::openFile(walk->directories().back(), kEntitlementsName, &problem);
  if (!file) {
    if (problem.code != kFileDoesNotExist) setError(error, std::move(problem));
    return {};
  }
  if (auto refusal = problemOfBundle(*walk, file)) {
    setError(error, std::move(*refusal));
    return {};
  }
  return readDictionary(*file, error);
}

}  // namespace platform
