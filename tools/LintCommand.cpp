#include "tools/LintCommand.h"

#include <fmt/format.h>

#include <algorithm>
#include <filesystem>

#include "Extora/XTPlugInCore.h"
#include "platform/bundle/PlatformBundle.h"
#include "platform/files/Directories.h"
#include "platform/log/Log.h"
#include "tools/BundleLint.h"
#include "tools/Json.h"
#include "tools/PlugInReference.h"

namespace tools {

using extora::XTExtensionPoints;
using platform::BundleScanner;
using platform::Dictionary;
using platform::Value;

namespace {

bool isError(const Finding& finding) {
  return finding.severity == Finding::Severity::Error;
}

Dictionary recordOf(const Finding& finding) {
  Dictionary record{{"severity", isError(finding) ? "error" : "warning"},
                    {"file", finding.file},
                    {"problem", finding.problem},
                    {"advice", finding.advice}};
  if (!finding.key.empty()) record.set("key", finding.key);
  return record;
}

std::string textOf(const std::vector<Finding>& findings) {
  std::string text;
  const std::string* file = nullptr;
  for (const Finding& finding : findings) {
    if (file == nullptr || *file != finding.file) text += platform::escapeControlCharacters(finding.file) + "\n";
    file = &finding.file;
    const std::string key = finding.key.empty() ? "" : finding.key + ": ";
    text += platform::escapeControlCharacters(
                fmt::format("  {}: {}{}", isError(finding) ? "error" : "warning", key, finding.problem)) +
            "\n    " + platform::escapeControlCharacters(finding.advice) + "\n";
  }
  return text;
}

// The extension points that programs find on this device, with what the bundles themselves declare.
XTExtensionPoints pointsOf(const platform::Directories& directories, const std::vector<std::string>& bundles) {
  std::vector<std::string> applications = bundles;
  std::vector<platform::ScanProblem> ignored;
  for (const auto* folders : {&directories.systemApplications, &directories.applications}) {
    for (const std::string& folder : *folders) {
      const auto found = BundleScanner::rootsIn(folder, BundleScanner::FolderKind::Applications, ignored);
      applications.insert(applications.end(), found.begin(), found.end());
    }
  }
  std::sort(applications.begin(), applications.end());
  XTExtensionPoints points(directories.extensionPoints);
  for (const std::string& application : applications) {
    const auto bundle = platform::PlatformBundle::create(application, platform::PlatformBundle::PathKind::Bundle);
    points.addApplication(bundle->info());
  }
  return points;
}

// The Info.plist as a host has it after the merge with the dictionary of its extension point.
Value mergedInfo(const std::string& path, const Value& info) {
  const auto record = extora::XTPlugInCore::initWithName(path, platform::Url::file(path), info, {}, {});
  if (record == nullptr) return {};
  record->resolveSDK();
  Dictionary merged(record->bundleInfoDictionary());
  merged.set(extora::XTExtoraInfoKey, record->plugInDictionary());
  return merged;
}

}  // namespace

CLI::App* LintCommand::addTo(CLI::App& app) {
  CLI::App* command = app.add_subcommand("lint", "Say what is wrong with bundles, before they are installed");
  command->add_option("bundle", bundles_, "Applications, with all their plug-ins, or plug-ins")
      ->required()
      ->option_text("BUNDLE...")
      ->check(CLI::ExistingDirectory);
  command->add_flag("--merged", merged_, "Print also what each Info.plist is once its extension point is merged in");
  command->add_flag("--json", json_, "One JSON object a line");
  command->footer(R"(An error keeps a bundle from being used; a warning is a mistake that has no such consequence, or
that depends on the device. Whether entitlements count is judged for the user who runs this.
Needs no daemon. The exit status is 1 when there is an error.

Examples
  xtctl lint build/Mail.app
  xtctl lint --merged Mail.app/PlugIns/Filter.appex)");
  return command;
}

ExitStatus LintCommand::run(DaemonSession& daemon, std::string& out) {
  const auto directories = platform::Directories::forClient(daemon.service());
  const auto paths = absolutePaths(bundles_);
  const XTExtensionPoints points = pointsOf(directories, paths);
  BundleLint lint(points, directories.profiles);
  for (const std::string& path : paths) lint.check(path);
  auto findings = lint.findings();
  std::stable_sort(findings.begin(), findings.end(),
                   [](const Finding& a, const Finding& b) { return a.file < b.file; });

  if (json_) {
    for (const Finding& finding : findings) out += jsonLine(recordOf(finding));
  } else {
    out += textOf(findings);
  }
  if (merged_) {
    extora::XTPlugInCore::setSDKProvider([&points](const auto& point) { return points.sdkDictionary(point); });
    for (const auto& [path, info] : lint.plugIns()) {
      const Value merged = mergedInfo(path, info);
      if (json_) {
        out += jsonLine(Dictionary{{"bundle", path}, {"merged", merged}});
      } else {
        out += platform::escapeControlCharacters(path) + ", merged\n" + jsonText(merged);
      }
    }
    extora::XTPlugInCore::setSDKProvider(nullptr);
  }
  const auto errors = std::count_if(findings.begin(), findings.end(), isError);
  const auto warnings = static_cast<std::ptrdiff_t>(findings.size()) - errors;
  if (!json_) {
    const auto counted = [](std::ptrdiff_t count, const char* what) {
      return fmt::format("{} {}{}", count, what, count == 1 ? "" : "s");
    };
    out += counted(errors, "error") + ", " + counted(warnings, "warning") + "\n";
  }
  return errors == 0 ? ExitStatus::Success : ExitStatus::Refused;
}

}  // namespace tools
