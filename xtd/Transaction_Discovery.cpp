// The "match" request: candidates of the database, duplicates, filter, parallel export, bookkeeping, overrides.
//
// 1. Filtering runs on the service queue, in candidate order. Accepted plug-ins are handed on in chunks, because
//    exporting one is a matter of microseconds and a hand-over to another thread costs more.
// 2. Full chunks are exported on the shared pool while filtering goes on; the last one on the service queue, which has
//    nothing to do but wait then. With few candidates, or on one core, no other thread is woken.
// 3. Bookkeeping runs one plug-in at a time on the request's own queue "com.orvane.xtd.postExporting".
#include <fmt/format.h>

#include <algorithm>
#include <limits>

#include "Extora/XTDaemonClient.h"
#include "Extora/XTLog.h"
#include "platform/files/ProcessPaths.h"
#include "platform/queue/ConcurrentQueue.h"
#include "platform/queue/Group.h"
#include "platform/queue/SerialQueue.h"
#include "platform/value/PropertyListKinds.h"
#include "xtd/DiscoveryResults.h"
#include "xtd/Probes.h"
#include "xtd/Transaction.h"
#include "xtd/XTDIpcClient.h"
#include "xtd/XTDServer.h"

namespace extora {
namespace {

using PlugIns = XTDatabase::PlugIns;
using platform::ConcurrentQueue;

constexpr std::size_t kSmallestChunk = 16;
constexpr std::size_t kChunksAThread = 4;

std::size_t chunkSize(std::size_t candidates) {
  const std::size_t width = ConcurrentQueue::shared().width();
  if (width <= 1) return std::numeric_limits<std::size_t>::max();
  return std::max(kSmallestChunk, candidates / (kChunksAThread * width));
}

// Exports the plug-ins of one request. Shared with the work in flight.
class Exporter : public std::enable_shared_from_this<Exporter> {
 public:
  using Finish = std::function<void(const XTDPlugIn& plugIn, Dictionary& form)>;

  Exporter(std::uint64_t flags, std::size_t candidates, Finish finish)
      : finish_(std::move(finish)), chunkSize_(chunkSize(candidates)), results_(flags) {}

  void add(std::shared_ptr<XTDPlugIn> plugIn) {
    if (chunk_.size() >= chunkSize_) submitChunk();
    chunk_.push_back(std::move(plugIn));
  }

  // The forms that stay, once every plug-in that was added has been exported.
  platform::Array wait() {
    auto forms = exportForms(chunk_);
    postExporting_.sync([&] { postExport(std::move(forms)); });
    group_.wait();
    return postExporting_.sync([this] {
      postExporting_.assertOnQueue();
      return results_.finish();
    });
  }

 private:
  using Forms = std::vector<std::pair<std::shared_ptr<XTDPlugIn>, Dictionary>>;

  void submitChunk() {
    group_.enter();
    ConcurrentQueue::shared().async([self = shared_from_this(), chunk = std::exchange(chunk_, {})] {
      auto forms = std::make_shared<Forms>(exportForms(chunk));
      self->postExporting_.async([self, forms] {
        self->postExport(std::move(*forms));
        self->group_.leave();
      });
    });
  }

  static Forms exportForms(const PlugIns& plugIns) {
    Forms forms;
    forms.reserve(plugIns.size());
    for (const auto& plugIn : plugIns) {
      Error error;
      Dictionary form(plugIn->exportForm(&error));
      if (!error.domain.empty()) XTLogOps().error("failed to export matching plug-in {}: {}", plugIn->uuid(), error);
      if (!form.empty()) forms.emplace_back(plugIn, std::move(form));
    }
    return forms;
  }

  void postExport(Forms forms) {
    postExporting_.assertOnQueue();
    for (auto& [plugIn, form] : forms) {
      if (!results_.admit(*plugIn)) continue;
      finish_(*plugIn, form);
      results_.append(*plugIn, std::move(form));
    }
  }

  const Finish finish_;
  const std::size_t chunkSize_;
  PlugIns chunk_;  // on the service queue
  platform::Group group_;
  platform::SerialQueue postExporting_{"com.orvane.xtd.postExporting"};
  DiscoveryResults results_ XT_GUARDED_BY(postExporting_);
};

// The versions of two plug-ins with the same identifier, for a log line.
std::string versionText(const XTDPlugIn& plugIn) {
  return plugIn.version().value_or("(null)");
}

// Logs why `plugIn` gives way to `favorite`, which lies in the host's own application, and answers true; false when it
// does not give way.
bool givesWay(const XTDPlugIn& plugIn, const XTDPlugIn& favorite) {
  if (plugIn.containingUrl() != favorite.containingUrl()) {
    XTLogOps().info("Ignoring {} @ '{}' in favor of bundle-relative '{}'", plugIn.uuid(), plugIn.path(),
                    favorite.path());
    return true;
  }
  if (plugIn.version() == favorite.version()) {
    XTLogOps().info("Found two plugins with same identifier & version. Ignoring {} @ '{}' in favor of first seen '{}'",
                    plugIn.uuid(), plugIn.path(), favorite.path());
    return true;
  }
  XTLogOps().info("Found two plugins with same identifier but different versions: {}({}) and {})({})",
                  plugIn.identifier(), versionText(plugIn), favorite.identifier(), versionText(favorite));
  return false;
}

// Drops candidates whose identifier a plug-in of the host's own application has too.
void resolveDuplicates(PlugIns& candidates, const std::shared_ptr<platform::IpcConnection>& connection) {
  if (connection == nullptr) return;
  int errorNumber = 0;
  const auto path = platform::processExecutablePath(*connection->peer(), &errorNumber);
  if (!path) {
    XTLogOps().error("Failed to determine path for pid {}, {}", connection->peer()->pid(), errorNumber);
    return;
  }
  std::unordered_map<std::string, std::shared_ptr<XTDPlugIn>> bundleRelative;
  for (const auto& candidate : candidates) {
    const auto& container = candidate->containingUrl();
    if (container && path->starts_with(container->path())) bundleRelative[candidate->identifier()] = candidate;
  }
  if (bundleRelative.empty()) return;
  std::erase_if(candidates, [&](const auto& candidate) {
    const auto found = bundleRelative.find(candidate->identifier());
    return found != bundleRelative.end() && !(*found->second == *candidate) && givesWay(*candidate, *found->second);
  });
}

// What decides whether a host is offered a candidate. On the service queue.
class CandidateFilter {
 public:
  CandidateFilter(XTDServer& server, XTDIpcClient& client, const Value& rules, std::uint64_t flags)
      : server_(server), client_(client), rules_(rules), flags_(flags), exclusions_(server.userPrefs().exclusions()) {
    if (const auto& bundle = client.bundle()) plugInsPath_ = bundle->plugInsPath();
  }

  bool accepts(const XTDPlugIn& plugIn) {
    const bool all = (flags_ & XTDiscoverAll) != 0;
    if (!all && !isOfferedToHost(plugIn)) return false;
    if (!plugIn.match(rules_)) return false;
    if (isExcluded(plugIn)) {
      XTLogOps().info("client {} plugin {} globally excluded", client_.pid(), plugIn.uuid());
      return false;
    }
    if (all) return true;
    if (!restriction_) restriction_ = client_.entitlementValueForKey(std::string(XTAllowedPlugInsEntitlement));
    const auto refusal = plugIn.allowForClient(client_, *restriction_);
    if (refusal) XTLogOps().info("client {} cannot use plugin {}: {}", client_.pid(), plugIn.uuid(), *refusal);
    return !refusal;
  }

 private:
  bool isOfferedToHost(const XTDPlugIn& plugIn) const {
    if (!plugIn.onSystemVolume()) {
      if (!plugIn.containingUrl() || (flags_ & XTDiscoverSystemOnly) != 0) return false;
    }
    if (plugIn.isDedicated() && !(plugInsPath_ && plugIn.path().starts_with(*plugInsPath_))) return false;
    return !server_.holdOnPlugIn(plugIn);
  }

  bool isExcluded(const XTDPlugIn& plugIn) const {
    const auto exclusions = exclusions_.items();
    return std::any_of(exclusions.begin(), exclusions.end(),
                       [&](const Value& rules) { return rules.isDictionary() && plugIn.match(rules); });
  }

  XTDServer& server_;
  XTDIpcClient& client_;
  const Value& rules_;
  const std::uint64_t flags_;
  const Value exclusions_;
  std::optional<Value> restriction_;        // of the client, once the request has come to need it
  std::optional<std::string> plugInsPath_;  // of the client's bundle
};

// "Candidate plugin count: 2, info: [...]", made only when somebody reads it.
template <typename Collection, typename Describe>
void logCount(const char* what, const char* listName, const Collection& collection, const Describe& describe) {
  if (!XTLogOps().enabled(platform::LogLevel::Info)) return;
  if (collection.size() == 0) {
    XTLogOps().info("{} plugin count: 0", what);
    return;
  }
  platform::Array list;
  for (const auto& element : collection) list.append(describe(element));
  XTLogOps().info("{} plugin count: {}, {}: {}", what, collection.size(), listName, Value(std::move(list)));
}

}  // namespace

void Transaction::matchPlugIns() {
  const Value& rules = request()[XTDRulesKey];
  if (!rules.isNothing() && !rules.isDictionary()) {
    fail(XTErrorRequest, "invalid request format (bad rules dictionary)");
    return;
  }
  const Value query = platform::toPropertyListKinds(rules);
  const std::uint64_t flags = request()[XTDFlagsKey].exactUnsigned();
  if ((flags & XTDiscoverAll) != 0 &&
      (!client_->hasEntitlement(std::string(XTManagerEntitlement)) || client_->isSandboxed())) {
    fail(XTErrorNotPermitted, "unauthorized discovery flag (XTDiscoverAll)");
    return;
  }
  CandidateFilter filter(server(), *client_, query, flags);
  PlugIns candidates = server().findPlugIns(query).value_or(PlugIns());
  probes::discoverRaw(static_cast<unsigned>(candidates.size()));
  logCount("Candidate", "info", candidates, [](const auto& plugIn) -> Value {
    return fmt::format("{}({}) {}", plugIn->identifier(), versionText(*plugIn), plugIn->uuid());
  });
  resolveDuplicates(candidates, connection());

  const auto exporter = std::make_shared<Exporter>(
      flags, candidates.size(), [this](const XTDPlugIn& plugIn, Dictionary& form) { finishForm(plugIn, form); });
  for (auto& candidate : candidates) {
    if (filter.accepts(*candidate)) exporter->add(std::move(candidate));
  }
  const Value matches = exporter->wait();
  logCount("Resulting", "UUIDs", matches.items(), [](const Value& form) { return form[XTUUIDFormKey]; });
  reply().set(XTDMatchesKey, XTDaemonClient::convertToIPC(matches, version_));
  XTLogOps().debug("reply marshalled");
  done();
}

}  // namespace extora
