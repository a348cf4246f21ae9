#include "platform/hostservices/SandboxOptions.h"

#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <vector>

namespace platform {
namespace {

// Beside /usr. Where they are links into it they are the same links in the sandbox.
constexpr const char* kLibraryFolders[] = {"/bin", "/sbin", "/lib", "/lib32", "/lib64", "/libx32"};
// What programs of /usr need to find their libraries.
constexpr const char* kLibraryFiles[] = {"/etc/ld.so.cache", "/etc/alternatives"};

using Words = std::vector<std::string>;

struct Mount {
  std::string path;
  Words words;
};

class Mounts {
 public:
  void add(const char* option, const std::string& path) { mounts_.push_back({path, {option, path}}); }
  void bind(const char* option, const std::string& path) { mounts_.push_back({path, {option, path, path}}); }
  void link(const std::string& target, const std::string& path) {
    mounts_.push_back({path, {"--symlink", target, path}});
  }
  // What lies in a folder comes after the folder, and of one path what was added last.
  const std::vector<Mount>& sorted() {
    std::stable_sort(mounts_.begin(), mounts_.end(), [](const Mount& a, const Mount& b) { return a.path < b.path; });
    return mounts_;
  }

 private:
  std::vector<Mount> mounts_;
};

void addSystem(Mounts& mounts) {
  mounts.bind("--ro-bind", "/usr");
  for (const char* folder : kLibraryFolders) {
    std::error_code error;
    const auto status = std::filesystem::symlink_status(folder, error);
    if (std::filesystem::is_symlink(status)) {
      mounts.link(std::filesystem::read_symlink(folder, error).native(), folder);
    } else if (std::filesystem::is_directory(status)) {
      mounts.bind("--ro-bind", folder);
    }
  }
  for (const char* file : kLibraryFiles) mounts.bind("--ro-bind-try", file);
  mounts.add("--proc", "/proc");
  mounts.add("--dev", "/dev");
  mounts.add("--tmpfs", "/tmp");
}

}  // namespace

std::string sandboxOptions(const JobManager::Launch& launch, const LaunchProfile& profile, const std::string& socket) {
  Words words = {"--unshare-user", "--unshare-pid",     "--unshare-ipc", "--disable-userns", "--cap-drop", "ALL",
                 "--new-session",  "--die-with-parent", "--as-pid-1",    "--chdir",          "/"};
  if (!profile.network) words.emplace_back("--unshare-net");
  Mounts mounts;
  addSystem(mounts);
  for (const std::string& path : profile.readOnly) mounts.bind("--ro-bind-try", path);
  for (const std::string& path : profile.writable) mounts.bind("--bind-try", path);
  mounts.bind("--ro-bind", launch.bundle);
  if (!launch.container.empty()) mounts.bind("--bind", launch.container);
  mounts.bind("--ro-bind", socket);
  for (const Mount& mount : mounts.sorted()) words.insert(words.end(), mount.words.begin(), mount.words.end());
  // The root itself, which held the places of all that.
  words.insert(words.end(), {"--remount-ro", "/"});

  std::string options;
  for (const std::string& word : words) options.append(word).push_back('\0');
  return options;
}

}  // namespace platform
