// KnowledgeStamp: a UUID that is read all the time and changed rarely. Reading takes no lock and never sees half of one
// UUID and half of another. One writer at a time; any thread reads.
#pragma once

#include <atomic>
#include <bit>
#include <cstdint>

#include "platform/value/Uuid.h"

namespace platform {

class KnowledgeStamp {
 public:
  void set(const Uuid& uuid) {
    const auto halves = std::bit_cast<Halves>(uuid.bytes());
    const std::uint64_t change = change_.load(std::memory_order_relaxed);
    change_.store(change + 1);  // odd: a change is being made
    first_.store(halves.first);
    second_.store(halves.second);
    change_.store(change + 2);
  }

  Uuid get() const {
    while (true) {
      const std::uint64_t change = change_.load(std::memory_order_acquire);
      const Halves halves{first_.load(std::memory_order_acquire), second_.load(std::memory_order_acquire)};
      if (change % 2 == 0 && change_.load(std::memory_order_acquire) == change) {
        const auto bytes = std::bit_cast<std::array<std::uint8_t, sizeof(Halves)>>(halves);
        return Uuid(std::span<const std::uint8_t, sizeof(Halves)>(bytes));
      }
    }
  }

 private:
  struct Halves {
    std::uint64_t first = 0;
    std::uint64_t second = 0;
  };
  std::atomic<std::uint64_t> change_{0};
  std::atomic<std::uint64_t> first_{0};
  std::atomic<std::uint64_t> second_{0};
};

}  // namespace platform
