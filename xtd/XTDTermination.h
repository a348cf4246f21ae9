// XTDTermination: one termination in progress: the job manager's answers on the queue "killer", and the wait for them
// on "killer-waiter". The wait is a count that is taken up again with each answer, so that a termination that waits
// costs no thread. Lives until its completion has run.
#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <string>

#include "platform/jobs/JobManager.h"
#include "platform/queue/SerialQueue.h"
#include "platform/registry/Records.h"

namespace extora {

class XTDTermination : public std::enable_shared_from_this<XTDTermination> {
 public:
  /// Asks `jobs` to end the running instances of `records` and calls `completion` on "killer-waiter" once each has been
  /// answered for, whatever the answers are. Returns at once.
  static void start(platform::JobManager& jobs, const platform::PlugInRecords& records,
                    std::function<void()> completion);

 private:
  XTDTermination(std::size_t count, std::function<void()> completion);
  void request(platform::JobManager& jobs, const platform::ARExtoraProxy& record);
  void answered(int error, const std::string& token);
  void wait() XT_REQUIRES(*waiter_);

  const std::size_t count_;
  const std::function<void()> completion_;
  const std::shared_ptr<platform::SerialQueue> killer_;
  const std::shared_ptr<platform::SerialQueue> waiter_;
  std::size_t signalled_ XT_GUARDED_BY(*waiter_) = 0;  // answers that the wait has not taken yet
  std::size_t taken_ XT_GUARDED_BY(*waiter_) = 0;
  bool begun_ XT_GUARDED_BY(*waiter_) = false;
  bool announced_ XT_GUARDED_BY(*waiter_) = false;  // the line for reply number `taken_` has been logged
};

}  // namespace extora
