#include "platform/sandbox/SandboxProfile.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/syscall.h>

#include "platform/codec/PropertyList.h"
#include "platform/sandbox/Landlock.h"

namespace orvanta::platform {
namespace {

// The least that a profile may allow.
Dictionary callsWith(const char* key = "refuse", Value value = Array{}) {
  Dictionary calls{{"allow", Array{"brk", "exit", "exit_group", "futex", "madvise", "mmap", "mprotect", "munmap",
                                   "read", "rt_sigreturn", "write"}}};
  calls.set(key, std::move(value));
  return calls;
}

Value profileWith(Value entry) {
  return Dictionary{{"version", 1}, {"files", Array{std::move(entry)}}, {"calls", callsWith()}};
}

Value calls(Value section) {
  return Dictionary{{"version", 1}, {"files", Array{}}, {"calls", std::move(section)}};
}

Dictionary callsWithLimit(const char* key, Value value) {
  Dictionary limit{{"call", "socket"}, {"argument", 0}, {"is", Array{"AF_UNIX"}}};
  limit.set(key, std::move(value));
  return callsWith("allowWith", Array{std::move(limit)});
}

Dictionary entryWith(const char* key, Value value) {
  Dictionary entry{{"paths", Array{"/srv"}}, {"access", Array{"read"}}};
  entry.set(key, std::move(value));
  return entry;
}

// Every other right and call is felt in the sandbox's own tests.
TEST(SandboxProfile, readsItsRules) {
  Dictionary calls = callsWith("refuse", Array{"clone3"});
  calls.set("untilStarted", Array{"listen", "s390_pci_mmio_read"});
  calls.set("allowWith", Array{Dictionary{{"call", "openat"},
                                          {"argument", 2},
                                          {"bits", Array{"O_ACCMODE", "O_TRUNC"}},
                                          {"is", Array{"O_RDONLY", 1}}},
                               Dictionary{{"call", "openat"}, {"argument", 0}, {"is", Array{7}}}});
  const auto profile = SandboxProfile::fromPropertyList(Dictionary{
      {"version", 1}, {"files", Array{entryWith("access", Array{"execute"})}}, {"landlockABI", 2}, {"calls", calls}});
  ASSERT_TRUE(profile) << profile.error();
  EXPECT_EQ(profile->files.at(0).rights, kLandlockExecute);
  EXPECT_EQ(profile->landlockAbi, 2);
  EXPECT_EQ(profile->calls.untilStarted, std::vector<int>{SYS_listen}) << "other machines' calls are left out";
  EXPECT_EQ(profile->calls.refuse, std::vector<int>{SYS_clone3});
  const auto& limits = profile->calls.allowWith;
  ASSERT_EQ(limits.size(), 2);
  EXPECT_EQ(limits[0].argument, 2);
  EXPECT_EQ(limits[0].bits, std::uint64_t{O_ACCMODE | O_TRUNC});
  EXPECT_EQ(limits[0].values, (std::vector<std::uint64_t>{0, 1}));
  EXPECT_EQ(limits[1].bits, ~std::uint64_t{0});
}

TEST(SandboxProfile, saysWhatIsWrong) {
  const std::string noPath = ", which is no absolute path or ${NAME} path";
  const std::string listOfWords = "files[0]: \"access\" must be a list of at least one word";
  const std::string noPaths = "files[0] names no path: give \"paths\" or \"directoriesOf\"";
  const std::pair<Value, std::string> documents[] = {
      {"text", "a profile must be a dictionary"},
      {Dictionary{}, "\"version\" must be 1"},
      {Dictionary{{"version", "1"}, {"files", Array{}}}, "\"version\" must be 1"},
      {Dictionary{{"version", 1}}, "\"files\" must be a list"},
      {Dictionary{{"version", 1}, {"files", Dictionary{}}}, "\"files\" must be a list"},
      {Dictionary{{"version", 1}, {"file", Array{}}}, "the profile: unknown key \"file\", did you mean \"files\"?"},
      {Dictionary{{"version", 1}, {"files", Array{}}}, "\"calls\" is missing"},
      {Dictionary{{"version", 1}, {"files", Array{}}, {"calls", callsWith()}, {"landlockABI", 0}},
       "\"landlockABI\" must be a number from 1"},
      {profileWith("/srv"), "files[0] must be a dictionary"},
      {profileWith(entryWith("acess", Array{"read"})), "files[0]: unknown key \"acess\", did you mean \"access\"?"},
      {profileWith(entryWith("optional", "yes")), "files[0]: \"optional\" must be true or false"},
      {profileWith(entryWith("optional", 1)), "files[0]: \"optional\" must be true or false"},
      {profileWith(entryWith("access", "read")), listOfWords},
      {profileWith(entryWith("access", Array{})), listOfWords},
      {profileWith(Dictionary{{"paths", Array{"/srv"}}}), listOfWords},
      {profileWith(entryWith("access", Array{"wirte"})), "files[0]: unknown access \"wirte\", did you mean \"write\"?"},
      {profileWith(entryWith("access", Array{7})), "files[0]: unknown access \"7\", did you mean \"read\"?"},
      {profileWith(Dictionary{{"access", Array{"read"}}}), noPaths},
      {profileWith(entryWith("paths", Array{})), noPaths},
      {profileWith(entryWith("paths", "/srv")), "files[0]: \"paths\" must be a list of paths"},
      {profileWith(entryWith("paths", Array{"srv"})), "files[0]: \"paths\" holds \"srv\"" + noPath},
      {profileWith(entryWith("paths", Array{"/a", 7})), "files[0]: \"paths\" holds 7" + noPath},
      {profileWith(entryWith("paths", Array{"/a/${B"})), "files[0]: \"paths\" holds \"/a/${B\"" + noPath},
      {profileWith(entryWith("directoriesOf", Array{"${}"})), "files[0]: \"directoriesOf\" holds \"${}\"" + noPath},
      {calls(Array{}), "\"calls\" must be a dictionary"},
      {calls(Dictionary{}), "calls: \"brk\" must be allowed: no program runs without it"},
      {calls(callsWith("alow")), "calls: unknown key \"alow\", did you mean \"allow\"?"},
      {calls(callsWith("end", "ptrace")), "calls: \"end\" must be a list of names"},
      {calls(callsWith("end", Array{101})), "calls: \"end\" holds 101, which is no name"},
      {calls(callsWith("end", Array{"ptrase"})),
       "calls: \"end\": unknown system call \"ptrase\", did you mean \"ptrace\"?"},
      {calls(callsWith("end", Array{"mmap"})), "calls: \"end\": \"mmap\" is in \"allow\" already"},
      {calls(callsWith("end", Array{"mount", "mount"})), "calls: \"end\": \"mount\" is in \"end\" already"},
      {calls(callsWith("allowWith", Dictionary{})), "calls: \"allowWith\" must be a list"},
      {calls(callsWith("allowWith", Array{"socket"})), "calls: allowWith[0] must be a dictionary"},
      {calls(callsWith("allowWith", Array{Dictionary{}})), "calls: allowWith[0]: \"call\" is missing"},
      {calls(callsWithLimit("call", "soket")),
       "calls: allowWith[0]: unknown system call \"soket\", did you mean \"socket\"?"},
      {calls(callsWithLimit("call", "read")), "calls: \"allow\": \"read\" is in \"allowWith\" already"},
      {calls(callsWithLimit("argument", 6)), "calls: allowWith[0]: \"argument\" must be a number from 0 to 5"},
      {calls(callsWithLimit("is", Array{})), "calls: allowWith[0]: \"is\" must be a list of at least one value"},
      {calls(callsWithLimit("is", Array{"AF_INET7"})),
       "calls: allowWith[0]: unknown value \"AF_INET7\", did you mean \"AF_INET\"?"},
      {calls(callsWithLimit("bit", Array{1})), "calls: allowWith[0]: unknown key \"bit\", did you mean \"bits\"?"},
  };
  for (const auto& [document, error] : documents) {
    const auto profile = SandboxProfile::fromPropertyList(document);
    ASSERT_FALSE(profile) << error;
    EXPECT_EQ(profile.error(), error);
  }
  EXPECT_FALSE(SandboxProfile::fromPropertyList(Dictionary{{std::string(1U << 20U, 'f'), 1}}));
}

TEST(SandboxProfile, fillsThePlacesOfAPath) {
  const std::map<std::string, std::string> variables = {{"A", "/a"}, {"B", "b"}, {"EMPTY", ""}, {"NESTED", "${A}"}};
  const std::pair<std::string_view, std::optional<std::string>> rows[] = {
      {"/etc", "/etc"},
      {"${A}", "/a"},
      {"${A}/x/${B}/${B}.d", "/a/x/b/b.d"},
      {"/$A/{B}", "/$A/{B}"},
      {"${NESTED}", "${A}"},
      {"${MISSING}", std::nullopt},
      {"/x/${EMPTY}", std::nullopt},
      {"${a}", std::nullopt},
      {"/x/${A", std::nullopt},
  };
  for (const auto& [path, expected] : rows) EXPECT_EQ(fillPlaces(path, variables), expected) << path;
}

TEST(Landlock, handlesNoMoreRightsThanTheKernelsAbiKnows) {
  const std::pair<int, std::uint64_t> rows[] = {{-1, 0},     {0, 0},      {1, 0x1fff}, {2, 0x3fff}, {3, 0x7fff},
                                                {4, 0x7fff}, {5, 0xffff}, {6, 0xffff}, {7, 0xffff}, {100, 0xffff}};
  for (const auto& [abi, rights] : rows) EXPECT_EQ(landlockRightsOfAbi(abi), rights) << abi;
}

TEST(SandboxProfile, theShippedProfileIsWellFormed) {
  const auto document =
      readPropertyListFile(ORVANTA_SOURCE_DIR "/packaging/share/orvanta/sandbox/com.kovalt.orvantad.plist");
  ASSERT_TRUE(document) << document.error();
  const auto profile = SandboxProfile::fromPropertyList(*document);
  ASSERT_TRUE(profile) << profile.error();
  for (const auto& rule : profile->files) {
    EXPECT_EQ(rule.rights & kLandlockExecute, 0) << "nothing is run";
    if ((rule.rights & kLandlockWriteFile) == 0) continue;
    for (const auto& path : rule.paths) EXPECT_TRUE(path.starts_with("${") || path == "/dev/null") << path;
  }
}

}  // namespace
}  // namespace orvanta::platform
