#include "platform/sandbox/Sandbox.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/prctl.h>

#include <cerrno>
#include <filesystem>
#include <optional>
#include <set>
#include <system_error>
#include <utility>
#include <vector>

#include "platform/codec/PropertyList.h"
#include "platform/core/Text.h"
#include "platform/sandbox/Landlock.h"

namespace orvanta::platform {

namespace {

// The directory in which `path` lies once symbolic links are followed; the path itself when it leads to a directory.
// Files are replaced by renaming, and a rule for the old one would not hold for the new one.
Result<std::string> realDirectoryOf(const std::string& path) {
  std::error_code error;
  const std::filesystem::path real = std::filesystem::canonical(path, error);
  if (error) return Failure{fmt::format("cannot resolve {}: {}", path, error.message())};
  const std::filesystem::path directory = std::filesystem::is_directory(real, error) ? real : real.parent_path();
  return directory.string();
}

// A profile's file rules being carried over into Landlock.
class FileRules {
 public:
  FileRules(Landlock& landlock, const std::map<std::string, std::string>& variables)
      : _landlock(landlock), _variables(variables) {}

  Result<void> add(const SandboxProfile::FileRule& rule) {
    for (const std::string& path : rule.paths) {
      if (auto added = addPath(path, false, rule); !added) return added;
    }
    for (const std::string& path : rule.directoriesOf) {
      if (auto added = addPath(path, true, rule); !added) return added;
    }
    return {};
  }

  std::size_t added() const { return _added; }
  const std::vector<std::string>& skipped() const { return _skipped; }

 private:
  Result<void> addPath(const std::string& written, bool itsDirectory, const SandboxProfile::FileRule& rule) {
    auto path = fillPlaces(written, _variables);
    if (!path) return skip(rule, written, written + " has a variable without a value");
    if (itsDirectory) {
      auto directory = realDirectoryOf(*path);
      if (!directory) return skip(rule, written, directory.error());
      path = std::move(*directory);
    }
    if (*path == "/") return skip(rule, written, written + " leads to the root directory, which is not opened up");
    const UniqueFd target(::open(path->c_str(), O_PATH | O_CLOEXEC));
    if (!target) return skip(rule, *path, fmt::format("cannot open {}: {}", *path, errnoText(errno)));
    if (auto allowed = _landlock.allow(target, rule.rights); !allowed) {
      return Failure{fmt::format("rule for {}: {}", *path, allowed.error())};
    }
    ++_added;
    return {};
  }

  Result<void> skip(const SandboxProfile::FileRule& rule, const std::string& path, std::string reason) {
    if (!rule.optional) return Failure{std::move(reason)};
    _skipped.push_back(path);
    return {};
  }

  Landlock& _landlock;
  const std::map<std::string, std::string>& _variables;
  std::size_t _added = 0;
  std::vector<std::string> _skipped;
};

std::size_t callsAllowed(const SandboxCalls& calls) {
  std::set<int> allowed(calls.allow.begin(), calls.allow.end());
  for (const auto& limit : calls.allowWith) allowed.insert(limit.call);
  return allowed.size();
}

}  // namespace

Result<std::unique_ptr<Sandbox>> Sandbox::enter(const std::string& directory, const std::string& name,
                                                const std::map<std::string, std::string>& variables) {
  const std::string path = directory + "/" + name + ".plist";
  const auto document = readPropertyListFile(path);
  if (!document) return Failure{fmt::format("sandbox profile {}: {}", name, document.error())};
  auto profile = SandboxProfile::fromPropertyList(*document);
  if (!profile) return Failure{fmt::format("sandbox profile {}: {}", path, profile.error())};
  const auto failed = [&name](const std::string& step) {
    return Failure{fmt::format("sandbox profile {}: {}", name, step)};
  };

  if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) return failed("no-new-privileges: " + errnoText(errno));
  auto landlock = Landlock::create(profile->landlockAbi);
  if (!landlock) return failed(landlock.error());
  FileRules rules(*landlock, variables);
  for (const SandboxProfile::FileRule& rule : profile->files) {
    if (auto added = rules.add(rule); !added) return failed(added.error());
  }
  if (auto restricted = landlock->restrictSelf(); !restricted) return failed(restricted.error());
  // Last: it leaves out the calls that all this has taken.
  auto refused = RefusedCalls::enter(profile->calls);
  if (!refused) return failed(refused.error());

  auto sandbox = none();
  sandbox->_description = fmt::format("sandbox profile {}: {} file rules, Landlock ABI {}, {} system calls", name,
                                      rules.added(), landlock->abi(), callsAllowed(profile->calls));
  if (!rules.skipped().empty()) {
    sandbox->_description += fmt::format(", not present: {}", fmt::join(rules.skipped(), " "));
  }
  sandbox->_calls = std::move(profile->calls);
  sandbox->_refused = std::move(*refused);
  return sandbox;
}

std::unique_ptr<Sandbox> Sandbox::none() {
  return std::unique_ptr<Sandbox>(new Sandbox());  // NOLINT(modernize-make-unique): the constructor is private
}

Result<void> Sandbox::started() {
  return refuseStartCalls(_calls);
}

}  // namespace orvanta::platform
