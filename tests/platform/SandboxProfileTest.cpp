#include "platform/SandboxProfile.h"

#include <gtest/gtest.h>

#include "platform/Landlock.h"
#include "platform/PropertyList.h"

namespace platform {
namespace {

Value profileWith(Value entry) {
  return Dictionary{{"version", 1}, {"files", Array{std::move(entry)}}};
}

Dictionary entryWith(const char* key, Value value) {
  Dictionary entry{{"paths", Array{"/srv"}}, {"access", Array{"read"}}};
  entry.set(key, std::move(value));
  return entry;
}

TEST(SandboxProfile, readsItsRules) {
  const Value document = Dictionary{
      {"version", 1},
      {"files",
       Array{Dictionary{{"paths", Array{"${STATE_DIRECTORY}", "/a/${B}/c"}},
                        {"access", Array{"read", "write", "create", "remove", "socket", "execute"}}},
             Dictionary{{"directoriesOf", Array{"/etc/resolv.conf"}}, {"access", Array{"read"}}, {"optional", true}}}}};
  const auto profile = SandboxProfile::fromPropertyList(document);
  ASSERT_TRUE(profile) << profile.error();
  ASSERT_EQ(profile->files.size(), 2);
  const auto& [paths, directoriesOf, rights, optional] = profile->files[0];
  EXPECT_EQ(paths, (std::vector<std::string>{"${STATE_DIRECTORY}", "/a/${B}/c"}));
  EXPECT_TRUE(directoriesOf.empty());
  EXPECT_EQ(rights, kLandlockReadFile | kLandlockReadDirectory | kLandlockWriteFile | kLandlockTruncate |
                        kLandlockMakeRegular | kLandlockMakeDirectory | kLandlockRemoveFile | kLandlockRemoveDirectory |
                        kLandlockMakeSocket | kLandlockExecute);
  EXPECT_FALSE(optional);
  EXPECT_EQ(profile->files[1].directoriesOf, std::vector<std::string>{"/etc/resolv.conf"});
  EXPECT_EQ(profile->files[1].rights, kLandlockReadFile | kLandlockReadDirectory);
  EXPECT_TRUE(profile->files[1].optional);
}

TEST(SandboxProfile, denyingEverythingIsAProfile) {
  const auto profile = SandboxProfile::fromPropertyList(Dictionary{{"version", 1}, {"files", Array{}}});
  ASSERT_TRUE(profile);
  EXPECT_TRUE(profile->files.empty());
}

TEST(SandboxProfile, saysWhatIsWrong) {
  struct Row {
    Value document;
    std::string error;
  };
  const Row rows[] = {
      {"text", "a profile must be a dictionary"},
      {Array{}, "a profile must be a dictionary"},
      {Dictionary{}, "\"version\" must be 1"},
      {Dictionary{{"version", 2}, {"files", Array{}}}, "\"version\" must be 1"},
      {Dictionary{{"version", "1"}, {"files", Array{}}}, "\"version\" must be 1"},
      {Dictionary{{"version", 1}}, "\"files\" must be a list"},
      {Dictionary{{"version", 1}, {"files", Dictionary{}}}, "\"files\" must be a list"},
      {Dictionary{{"version", 1}, {"file", Array{}}}, "the profile: unknown key \"file\", did you mean \"files\"?"},
      {Dictionary{{"Version", 1}}, "the profile: unknown key \"Version\", did you mean \"version\"?"},
      {profileWith("/srv"), "files[0] must be a dictionary"},
      {profileWith(entryWith("acess", Array{"read"})), "files[0]: unknown key \"acess\", did you mean \"access\"?"},
      {profileWith(entryWith("optinal", true)), "files[0]: unknown key \"optinal\", did you mean \"optional\"?"},
      {profileWith(entryWith("optional", "yes")), "files[0]: \"optional\" must be true or false"},
      {profileWith(entryWith("optional", 1)), "files[0]: \"optional\" must be true or false"},
      {profileWith(entryWith("access", "read")), "files[0]: \"access\" must be a list of at least one word"},
      {profileWith(entryWith("access", Array{})), "files[0]: \"access\" must be a list of at least one word"},
      {profileWith(Dictionary{{"paths", Array{"/srv"}}}), "files[0]: \"access\" must be a list of at least one word"},
      {profileWith(entryWith("access", Array{"read", "wirte"})),
       "files[0]: unknown access \"wirte\", did you mean \"write\"?"},
      {profileWith(entryWith("access", Array{7})), "files[0]: unknown access \"7\", did you mean \"read\"?"},
      {profileWith(Dictionary{{"access", Array{"read"}}}),
       "files[0] names no path: give \"paths\" or \"directoriesOf\""},
      {profileWith(entryWith("paths", Array{})), "files[0] names no path: give \"paths\" or \"directoriesOf\""},
      {profileWith(entryWith("paths", "/srv")), "files[0]: \"paths\" must be a list of paths"},
      {profileWith(entryWith("paths", Array{"srv"})),
       "files[0]: \"paths\" holds \"srv\", which is no absolute path or ${NAME} path"},
      {profileWith(entryWith("paths", Array{""})),
       "files[0]: \"paths\" holds \"\", which is no absolute path or ${NAME} path"},
      {profileWith(entryWith("paths", Array{"/a", 7})),
       "files[0]: \"paths\" holds 7, which is no absolute path or ${NAME} path"},
      {profileWith(entryWith("paths", Array{"/a/${B"})),
       "files[0]: \"paths\" holds \"/a/${B\", which is no absolute path or ${NAME} path"},
      {profileWith(entryWith("directoriesOf", Array{"${}"})),
       "files[0]: \"directoriesOf\" holds \"${}\", which is no absolute path or ${NAME} path"},
  };
  for (const Row& row : rows) {
    const auto profile = SandboxProfile::fromPropertyList(row.document);
    ASSERT_FALSE(profile) << row.error;
    EXPECT_EQ(profile.error(), row.error);
  }
  const auto longKey = SandboxProfile::fromPropertyList(Dictionary{{std::string(1U << 20U, 'f'), 1}});
  EXPECT_FALSE(longKey);
}

TEST(SandboxProfile, fillsThePlacesOfAPath) {
  const std::map<std::string, std::string> variables = {{"A", "/a"}, {"B", "b"}, {"EMPTY", ""}, {"NESTED", "${A}"}};
  struct Row {
    std::string_view path;
    std::optional<std::string> expected;
  };
  const Row rows[] = {
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
  for (const Row& row : rows) EXPECT_EQ(fillPlaces(row.path, variables), row.expected) << row.path;
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
}  // namespace platform
