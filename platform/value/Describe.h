// Lets fmt print everything that has describe(): values, errors, UUIDs, URLs and the system's own objects.
#pragma once

#include <fmt/format.h>

#include <concepts>
#include <string>

namespace platform {

template <typename T>
concept Describable = requires(const T& object) {
  { object.describe() } -> std::convertible_to<std::string>;
};

}  // namespace platform

template <platform::Describable T>
struct fmt::formatter<T> : fmt::formatter<std::string> {
  template <typename Context>
  auto format(const T& object, Context& context) const {
    return fmt::formatter<std::string>::format(object.describe(), context);
  }
};
