#include "platform/sandbox/SandboxProfile.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <seccomp.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/socket.h>

#include <sched.h>
#include <algorithm>
#include <array>
#include <cstdlib>
#include <iterator>
#include <map>
#include <optional>
#include <string_view>
#include <utility>

#include "platform/core/Text.h"

namespace orvanta::platform {

namespace {

constexpr std::string_view kLimitsKey = "allowWith";

constexpr int kHighestCall = 1023;  // beyond what any kernel numbers its calls with

// Without these no program can end, and a process in a sandbox without one would hang instead of saying so.
constexpr const char* kIndispensable[] = {"brk",      "exit",   "exit_group", "futex",        "madvise", "mmap",
                                          "mprotect", "munmap", "read",       "rt_sigreturn", "write"};

struct Constant {
  std::string_view name;
  std::uint64_t value;
};

constexpr std::uint64_t kNameMemory = 0x53564d41;  // PR_SET_VMA, which older headers lack

constexpr Constant kConstants[] = {
    {"AF_UNIX", AF_UNIX},        {"AF_INET", AF_INET},           {"AF_INET6", AF_INET6},
    {"AF_NETLINK", AF_NETLINK},  {"CLONE_THREAD", CLONE_THREAD}, {"O_ACCMODE", O_ACCMODE},
    {"O_RDONLY", O_RDONLY},      {"O_WRONLY", O_WRONLY},         {"O_RDWR", O_RDWR},
    {"O_TRUNC", O_TRUNC},        {"PROT_WRITE", PROT_WRITE},     {"PROT_EXEC", PROT_EXEC},
    {"FIONBIO", FIONBIO},        {"FIONREAD", FIONREAD},         {"FIOCLEX", FIOCLEX},
    {"TCGETS", TCGETS},          {"PR_SET_NAME", PR_SET_NAME},   {"PR_GET_NAME", PR_GET_NAME},
    {"PR_SET_VMA", kNameMemory},
};

// The names of this machine's system calls, for those that are misspelt.
std::string nearestCall(std::string_view word) {
  std::vector<std::string> names;
  for (int number = 0; number <= kHighestCall; ++number) {
    char* const name = ::seccomp_syscall_resolve_num_arch(SCMP_ARCH_NATIVE, number);
    if (name != nullptr) names.emplace_back(name);
    std::free(name);  // NOLINT(cppcoreguidelines-no-malloc): the library's own
  }
  const std::vector<std::string_view> known(names.begin(), names.end());
  return std::string(nearestWord(word, known));
}

// Reads the section; keeps what each call was named for, so that no call has two meanings.
class Reader {
 public:
  explicit Reader(const Dictionary& section) : _section(section) {}

  Result<void> names(const char* key, std::vector<int>& calls) {
    const Value* const value = _section.find(key);
    if (value == nullptr) return {};
    if (value->array() == nullptr) return Failure{fmt::format("calls: \"{}\" must be a list of names", key)};
    for (const Value& item : *value->array()) {
      const auto call = resolve(item, fmt::format("calls: \"{}\"", key), key);
      if (!call) return Failure{call.error()};
      if (*call) calls.push_back(**call);
    }
    return {};
  }

  Result<void> limits(const char* key, std::vector<SandboxCalls::Limit>& limits) {
    const Value* const value = _section.find(key);
    if (value == nullptr) return {};
    if (value->array() == nullptr) return Failure{fmt::format("calls: \"{}\" must be a list", key)};
    for (std::size_t index = 0; index < value->array()->size(); ++index) {
      auto added = limit((*value->array())[index], fmt::format("calls: {}[{}]", key, index), key, limits);
      if (!added) return added;
    }
    return {};
  }

 private:
  // Nullopt: a call that this machine does not have.
  Result<std::optional<int>> resolve(const Value& item, const std::string& place, const char* key) {
    if (item.string() == nullptr) {
      return Failure{fmt::format("{} holds {}, which is no name", place, item.description())};
    }
    const std::string& name = *item.string();
    const int number = ::seccomp_syscall_resolve_name(name.c_str());
    if (number == __NR_SCMP_ERROR) {
      return Failure{
          fmt::format("{}: unknown system call \"{}\", did you mean \"{}\"?", place, name, nearestCall(name))};
    }
    const auto [known, isNew] = _meanings.emplace(number, key);
    const bool isFurtherLimit = known->second == kLimitsKey && std::string_view(key) == kLimitsKey;
    if (!isNew && !isFurtherLimit) {
      return Failure{fmt::format("{}: \"{}\" is in \"{}\" already", place, name, known->second)};
    }
    return number < 0 ? std::nullopt : std::optional<int>(number);
  }

  static Result<std::uint64_t> number(const Value& value, const std::string& place) {
    if (value.isInteger() && value.integerValue() >= 0) return static_cast<std::uint64_t>(value.integerValue());
    const std::string word = value.string() != nullptr ? *value.string() : value.description();
    std::vector<std::string_view> known;
    for (const Constant& constant : kConstants) {
      if (constant.name == word) return constant.value;
      known.push_back(constant.name);
    }
    return Failure{
        fmt::format("{}: unknown value \"{}\", did you mean \"{}\"?", place, word, nearestWord(word, known))};
  }

  static Result<std::vector<std::uint64_t>> numbers(const Dictionary& entry, const char* key,
                                                    const std::string& place) {
    const Array* const values = entry.array(key);
    if (values == nullptr || values->empty()) {
      return Failure{fmt::format("{}: \"{}\" must be a list of at least one value", place, key)};
    }
    std::vector<std::uint64_t> read;
    for (const Value& item : *values) {
      const auto one = number(item, place);
      if (!one) return Failure{one.error()};
      read.push_back(*one);
    }
    return read;
  }

  Result<void> limit(const Value& value, const std::string& place, const char* key,
                     std::vector<SandboxCalls::Limit>& limits) {
    const Dictionary* const entry = value.dictionary();
    if (entry == nullptr) return Failure{place + " must be a dictionary"};
    static constexpr std::string_view kKeys[] = {"call", "argument", "bits", "is"};
    if (const std::string unknown = describeUnknownKeys(*entry, kKeys); !unknown.empty()) {
      return Failure{place + ": " + unknown};
    }
    const Value* const name = entry->find("call");
    if (name == nullptr) return Failure{place + ": \"call\" is missing"};
    const auto call = resolve(*name, place, key);
    if (!call) return Failure{call.error()};
    SandboxCalls::Limit limit;
    const Value* const argument = entry->find("argument");
    if (argument == nullptr || !argument->isInteger() || argument->integerValue() < 0 || argument->integerValue() > 5) {
      return Failure{place + ": \"argument\" must be a number from 0 to 5"};
    }
    limit.argument = static_cast<unsigned>(argument->integerValue());
    if (entry->find("bits") != nullptr) {
      const auto bits = numbers(*entry, "bits", place);
      if (!bits) return Failure{bits.error()};
      limit.bits = 0;
      for (const std::uint64_t bit : *bits) limit.bits |= bit;
    }
    auto values = numbers(*entry, "is", place);
    if (!values) return Failure{values.error()};
    limit.values = std::move(*values);
    if (*call) {
      limit.call = **call;
      limits.push_back(std::move(limit));
    }
    return {};
  }

  const Dictionary& _section;
  std::map<int, std::string_view> _meanings;  // a call's number, other machines' calls included → its list
};

}  // namespace

Result<SandboxCalls> SandboxCalls::fromPropertyList(const Value& section) {
  const Dictionary* const content = section.dictionary();
  if (content == nullptr) return Failure{"\"calls\" must be a dictionary"};
  static constexpr std::string_view kKeys[] = {"allow", "allowWith", "untilStarted", "refuse", "end"};
  if (const std::string unknown = describeUnknownKeys(*content, kKeys); !unknown.empty()) {
    return Failure{"calls: " + unknown};
  }
  SandboxCalls calls;
  Reader reader(*content);
  if (auto read = reader.limits("allowWith", calls.allowWith); !read) return Failure{read.error()};
  if (auto read = reader.names("allow", calls.allow); !read) return Failure{read.error()};
  if (auto read = reader.names("untilStarted", calls.untilStarted); !read) return Failure{read.error()};
  if (auto read = reader.names("refuse", calls.refuse); !read) return Failure{read.error()};
  if (auto read = reader.names("end", calls.end); !read) return Failure{read.error()};
  for (const char* const name : kIndispensable) {
    const int number = ::seccomp_syscall_resolve_name(name);
    const auto isIt = [number](int call) { return call == number; };
    if (std::none_of(calls.allow.begin(), calls.allow.end(), isIt) &&
        std::none_of(calls.allowWith.begin(), calls.allowWith.end(), [&](const Limit& l) { return isIt(l.call); })) {
      return Failure{fmt::format("calls: \"{}\" must be allowed: no program runs without it", name)};
    }
  }
  return calls;
}

}  // namespace orvanta::platform
