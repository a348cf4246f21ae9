// Finding: one thing that is wrong with a bundle, or may be.
#pragma once

#include <functional>
#include <string>

namespace tools {

struct Finding {
  enum class Severity { Error, Warning };
  Severity severity = Severity::Warning;
  std::string file;     ///< where it stands; the bundle itself when it is about no file of it
  std::string key;      ///< empty: about no key
  std::string problem;  ///< what is wrong
  std::string advice;   ///< what to do
};

using Report = std::function<void(Finding finding)>;

}  // namespace tools
