#include "xtd/RecordText.h"

#include <fmt/format.h>

#include "platform/value/Describe.h"

namespace extora {
namespace {

std::string orNull(const std::string& text) {
  return text.empty() ? platform::Value().describe() : text;
}

}  // namespace

std::string describeRecords(const platform::PlugInRecords& records) {
  std::string text = "(";
  for (const platform::PlugInRecord& record : records) {
    if (text.size() > 1) text += ", ";
    text += record->describe();
  }
  return text + ")";
}

std::string describeInstallation(const platform::ARExtoraProxy& record) {
  return fmt::format("{} {}({}) {} {}", orNull(record.bundleIdentifier), orNull(record.plugInIdentifier),
                     orNull(record.bundleVersion), orNull(record.plugInUUID ? record.plugInUUID->text() : ""),
                     orNull(record.bundleURL ? record.bundleURL->path() : ""));
}

std::string describePlugIns(const std::vector<std::shared_ptr<XTDPlugIn>>& plugIns) {
  std::string text = "[";
  for (const auto& plugIn : plugIns) text += (text.size() > 1 ? ", " : "") + plugIn->describe();
  return text + "]";
}

}  // namespace extora
