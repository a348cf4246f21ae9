// DaemonSession: one client of the daemon, for a program that asks a question and waits for the answer.
//
// For one thread. Connects at the first question, so that a command that needs no daemon costs none.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "Extora/XTDaemonClient.h"
#include "tools/ExitStatus.h"

namespace tools {

class DaemonSession {
 public:
  const std::string& service() const { return service_; }
  /// Sends one request by means of the client; the reply function must be called exactly once, from any thread.
  using Send = std::function<void(extora::XTDaemonClient& client, const extora::XTDaemonClient::Reply& reply)>;

  explicit DaemonSession(std::string service) : service_(std::move(service)) {}

  /// Sends, waits without limit, and puts the reply dictionary into `reply`. A failure is written to standard error and
  /// leaves `reply` untouched: Refused when the daemon answered with an error, Unreachable when it did not answer.
  /// `hint` is a second line for a refusal of what the caller may not do, empty for none.
  [[nodiscard]] ExitStatus ask(const Send& send, platform::Value& reply, const std::string& hint = {});

  /// A "match" with these rules and flags, likewise: its forms go into `forms`.
  [[nodiscard]] ExitStatus match(const platform::Dictionary& rules, std::uint64_t flags, platform::Value& forms);

  /// As ask(), but hands the reply on as it is and says nothing.
  [[nodiscard]] platform::IpcReplyObject request(const Send& send);
  /// False before the first question, and when the connection has been lost.
  bool isConnected() const { return client_ && client_->xtd() && client_->xtd()->isValid(); }
  /// Lets go of a connection that has been lost: the next question makes a new one.
  void reconnect() { client_.reset(); }

  /// What "matches" of a reply carries, opened; the nothing value when there is none.
  platform::Value matches(const platform::Value& reply) const;

 private:
  std::string service_;
  std::shared_ptr<extora::XTDaemonClient> client_;
};

}  // namespace tools
