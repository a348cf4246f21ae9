#include "platform/assertions/ProcessAssertions.h"

namespace platform {

namespace {

class JobAssertions : public ProcessAssertions {
 public:
  explicit JobAssertions(std::shared_ptr<JobManager> jobs) : jobs_(std::move(jobs)) {}

  Value queryBusyInstances(const std::set<std::string>& bundleIdentifiers) override {
    Array busy;
    for (const std::string& identifier : bundleIdentifiers) {
      for (const JobManager::Instance& instance : jobs_->instances(identifier)) {
        if (!instance.busy) continue;
        busy.append(Dictionary{{kBusyBundleIdentifierKey, instance.bundleIdentifier},
                               {"pid", static_cast<std::int64_t>(instance.pid)}});
      }
    }
    return busy;
  }

 private:
  const std::shared_ptr<JobManager> jobs_;
};

}  // namespace

std::shared_ptr<ProcessAssertions> ProcessAssertions::make(std::shared_ptr<JobManager> jobs) {
  return std::make_shared<JobAssertions>(std::move(jobs));
}

}  // namespace platform
