#include "xtd/XTDTermination.h"

#include "Extora/XTLog.h"

namespace extora {

void XTDTermination::start(platform::JobManager& jobs, const platform::PlugInRecords& records,
                           std::function<void()> completion) {
  std::shared_ptr<XTDTermination> termination(new XTDTermination(records.size(), std::move(completion)));
  for (const auto& record : records) termination->request(jobs, *record);
  termination->waiter_->async([termination] {
    termination->waiter_->assertOnQueue();
    XTLogOps().debug("waiting for {} termination replies", termination->count_);
    termination->begun_ = true;
    termination->wait();
  });
}

XTDTermination::XTDTermination(std::size_t count, std::function<void()> completion)
    : count_(count),
      completion_(std::move(completion)),
      killer_(std::make_shared<platform::SerialQueue>("killer")),
      waiter_(std::make_shared<platform::SerialQueue>("killer-waiter")) {}

void XTDTermination::request(platform::JobManager& jobs, const platform::ARExtoraProxy& record) {
  const platform::Value& declared = record.infoDictionary["HBBundleVersion"];
  const std::string version = declared.isString() ? declared.string() : "1";
  const std::string token = record.plugInUUID ? record.plugInUUID->text() : std::string();
  XTLogOps().debug("requesting termination for {}({}) jobmgr:{} {}", record.bundleIdentifier, record.bundleVersion,
                   version, token);
  jobs.jobRemoveExternalService(record.bundleIdentifier, version, killer_,
                                [self = shared_from_this(), token](int error) { self->answered(error, token); });
}

void XTDTermination::answered(int error, const std::string& token) {
  if (error == platform::JobManager::kNoneOnRecord) {
    XTLogOps().debug("jobmgr reported no plug-ins on record for uuid={}", token);
  } else if (error != 0) {
    XTLogOps().error("jobmgr error attempting to terminate plug-ins: error={} for uuid={}", error, token);
  } else {
    XTLogOps().info("one or more plug-ins have been terminated for uuid={}", token);
  }
  waiter_->async([self = shared_from_this()] {
    self->waiter_->assertOnQueue();
    ++self->signalled_;
    self->wait();
  });
}

void XTDTermination::wait() {
  if (!begun_) return;  // an answer may come before the wait has begun
  while (taken_ < count_) {
    if (!announced_) XTLogOps().debug("awaiting termination reply #{}", taken_);
    announced_ = true;
    if (signalled_ == 0) return;
    --signalled_;
    ++taken_;
    announced_ = false;
  }
  XTLogOps().debug("sending termination reply");
  completion_();
}

}  // namespace extora
