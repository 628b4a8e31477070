#include "backends/https/EventRecord.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <random>

#include "backends/https/EventField.h"
#include "backends/https/PostMessage.h"
#include "platform/codec/Json.h"
#include "tests/backends/https/HTTPSFixture.h"
#include "tests/support/LogCapture.h"

namespace orvanta::test {
namespace {

constexpr const char* kRemovedLine =
    "<4>HTTPSPostBackend(createMessageForPostAndLogging): Tressel unable to handle key: ";

class EventRecordTest : public HTTPSFixture {
 protected:
  static std::shared_ptr<const SessionFields> fieldsOf(const BackendIdentity& identity, bool internalBuild = false) {
    return SessionFields::of(identity, internalBuild);
  }
  static Dictionary parsed(const std::string& json) {
    auto value = platform::parseJson(json);
    if (!value || value->dictionary() == nullptr) {
      ADD_FAILURE() << json;
      return {};
    }
    return *value->dictionary();
  }
  static std::string write(const EventRecord& record, FieldWriter::Form form,
                           const EventRecord::Overlay& overlay = {}) {
    std::string json;
    FieldWriter writer(json, form);
    record.write(writer, overlay);
    writer.finish();
    return json;
  }
};

TEST_F(EventRecordTest, EveryReservedKeyWithItsType) {
  const auto fields = fieldsOf(defaultIdentity());
  EventRecord record(fields, {nullptr, {1'700'000'000, 500'000}, 3, 4, EventFlag::none, 65535}, "root.own", -3600);
  record.prepare(nullptr, {});
  EXPECT_EQ(write(record, FieldWriter::Form::compact),
            "{\"_startTS\":1699999980,\"_sender\":\"ZK\",\"_clientVersion\":42,\"_productFamily\":\"Parva\","
            "\"_productModel\":\"Parva3,2\",\"_osVersion\":\"12.5\",\"_build\":\"12F5\",\"_internal\":2,"
            "\"_reportVers\":\"8.0\",\"_sessionID\":\"root.own\",\"_eventNumber\":65535,\"_method\":3,\"_status\":4,"
            "\"_clientTS\":1699999990.25,\"eventTime\":1699999990.25,\"_timezoneOffset\":-3600}");
}

TEST_F(EventRecordTest, ReservedKeysThatDependOnTheSession) {
  using Identity = BackendIdentity;
  const auto type = [](int clientType, bool isInternal = false, std::uint32_t sessionID = 77) {
    return [=](Identity& identity) {
      identity.clientType = clientType;
      identity.isInternal = isInternal;
      identity.sessionID = sessionID;
    };
  };
  const auto same = [](Identity&) {};
  const struct {
    const char* what;
    std::function<void(Identity&)> change;
    const char* key;
    Value expected;  // null: absent
    std::optional<std::string> combined = "a.b";
    bool internalBuild = false;
  } rows[] = {
      {"combined identifier", same, "_sessionID", "a.b"},
      {"no identifier", same, "_sessionID", nullptr, std::nullopt},
      {"type 7", type(7), "_sessionID", 77},
      {"type 11, internal", type(11, true), "_sessionID", 77},
      {"type 13, internal", type(13, true), "_sessionID", 77, std::nullopt},
      {"type 12, internal", type(12, true), "_sessionID", "a.b"},
      {"largest number", type(7, false, 4'294'967'295U), "_sessionID", 4'294'967'295U},
      {"type 15", type(15), "_sender", "QB-JOVEX"},
      {"internal build", same, "_internal", 3, "a", true},
      {"no model", [](Identity& i) { i.productType.reset(); }, "_productModel", nullptr},
      {"start within a minute", [](Identity& i) { i.startTimestamp.seconds = 1'000'059; }, "_startTS", 1'000'020},
  };
  for (const auto& row : rows) {
    BackendIdentity identity = defaultIdentity();
    row.change(identity);
    EventRecord record(fieldsOf(identity, row.internalBuild), {}, row.combined, 0);
    record.prepare(nullptr, {});
    const Dictionary event = parsed(write(record, FieldWriter::Form::compact));
    const Value* value = event.find(row.key);
    EXPECT_EQ(value == nullptr ? Value() : *value, row.expected) << row.what;
  }
}

TEST_F(EventRecordTest, JsonTypesOfPayloads) {
  const LogCapture log;
  const auto payload = shared({{"bool", true},
                               {"date", platform::Date{12.5}},
                               {"huge", std::numeric_limits<std::uint64_t>::max()},
                               {"int", -5},
                               {"never", platform::Date{std::nan("")}},
                               {"real", 0.1},
                               {"text", "a\"\n\xC3\xA4"},
                               {"array", Array{1}},
                               {"data", platform::Data{{1}}},
                               {"dictionary", Dictionary{{"a", 1}}},
                               {"infinite", -std::numeric_limits<double>::infinity()},
                               {"nan", std::nan("")},
                               {"null", nullptr}});
  EventRecord record(fieldsOf(defaultIdentity()), {.payload = payload}, "own", 0);
  record.prepare(nullptr, {});
  const std::string json = write(record, FieldWriter::Form::compact);
  EXPECT_NE(json.find("\"bool\":true,\"date\":12.5,\"huge\":18446744073709551615,\"int\":-5,\"never\":-1"),
            std::string::npos)
      << json;
  EXPECT_NE(json.find("\"real\":0.1,\"text\":\"a\\\"\\n\xC3\xA4\"}"), std::string::npos) << json;
  for (const char* key : {"array", "data", "dictionary", "infinite", "nan", "null"}) {
    EXPECT_EQ(json.find(std::string("\"") + key), std::string::npos) << key;
    EXPECT_EQ(log.count(kRemovedLine + std::string(key) + ", value: "), 1U) << key;
  }
  write(record, FieldWriter::Form::pretty);
  EXPECT_EQ(log.count(kRemovedLine), 6U) << "the pretty form logs nothing again";
}

// Dictionaries and filters of few keys and of values of every type, so that they meet often.
struct RandomRecords {
  std::size_t upTo(std::size_t n) { return std::uniform_int_distribution<std::size_t>(0, n)(random); }
  bool chance(double p) { return std::bernoulli_distribution(p)(random); }
  const char* key() {
    static const char* const kKeys[] = {
        "a",        "A",       "b",      "userName",   "USERNAME", "clientName", "serviceName", "_method",
        "_status",  "_METHOD", "_build", "_sessionID", "_sender",  "_osVersion", "eventTime",   "EVENTTIME",
        "_startTS", "_custom", "größe",  "_internal",  "",         "_clientTS",  "with blanks"};
    return kKeys[upTo(std::size(kKeys) - 1)];
  }
  Dictionary dictionary(std::size_t most) {
    static const Array kSent{true, 0.25, 1ULL << 63U, "3", "quote \" and €", platform::Date{1.5}, 0, 1, 2, 3};
    static const Array kNeverSent{std::nan(""), nullptr, Array{1, "x"}, Dictionary{{"x", 1}}};
    Dictionary made;
    for (std::size_t i = upTo(most); i > 0; --i) {
      const Array& values = chance(0.3) ? kNeverSent : kSent;
      made.set(key(), values[upTo(values.size() - 1)]);
    }
    return made;
  }
  EventFilters filters() {
    Array rules;
    for (std::size_t i = upTo(6); i > 0; --i) {
      Dictionary rule{{"key", key()}, {"action", chance(0.2) ? "none" : chance(0.5) ? "remove" : "sha256"}};
      if (chance(0.4)) rule.set("method", static_cast<int>(upTo(5)) - 1);
      if (chance(0.3)) rule.set("status", static_cast<int>(upTo(4)) - 1);
      rules.emplace_back(rule);
    }
    return *EventFilters::createFiltersFromArray(rules);
  }
  std::mt19937 random;
};

// However payload, user info, filters, relabelling and flush meet, the record is the flat dictionary that the steps one
// after another make.
TEST_F(EventRecordTest, EqualsTheStepwiseDictionary) {
  for (unsigned seed = 0; seed < 4000; ++seed) {
    RandomRecords random{std::mt19937(seed)};
    BackendIdentity identity = defaultIdentity();
    if (random.chance(0.3)) identity.productVersion.reset();
    if (random.chance(0.3)) identity.clientType = 7;
    const auto fields = fieldsOf(identity);
    const SharedDictionary payload = random.chance(0.1) ? nullptr : shared(random.dictionary(12));
    const SharedDictionary userInfo = random.chance(0.2) ? nullptr : shared(random.dictionary(5));
    const std::optional<std::string> combined = random.chance(0.3) ? std::nullopt : std::optional<std::string>("own");
    Event event{payload, {1000, 500'000}};
    event.category = static_cast<std::uint16_t>(random.upTo(4));
    event.type = static_cast<std::uint16_t>(random.upTo(3));
    const EventFilters filters = random.filters();
    EventRecord record(fields, event, combined, 0);
    const auto layer = RecordLayer::of(userInfo);
    record.prepare(layer, filters);

    Dictionary flat = payload ? *payload : Dictionary();
    for (std::size_t i = 0; i < kReservedKeyCount; ++i) {
      const Value constant = fields->value(static_cast<ReservedKey>(i));
      if (!constant.isNull()) flat.set(kReservedKeyNames[i], constant);
    }
    if (combined) flat.set("_sessionID", *combined);
    if (fields->numericSessionID) flat.set("_sessionID", *fields->numericSessionID);
    flat.merge({{"_eventNumber", 0},
                {"_method", int{event.category}},
                {"_status", int{event.type}},
                {"_clientTS", fields->clientTS(event.time)},
                {"eventTime", fields->clientTS(event.time)},
                {"_timezoneOffset", 0}});
    if (userInfo) flat.merge(*userInfo);
    filters.filterEvent(flat);
    const Value* category = flat.find("_method");
    ASSERT_EQ(record.category(), category == nullptr ? 0 : static_cast<std::int32_t>(category->integerValue())) << seed;

    EventRecord::Overlay overlay;
    const std::string label = "root.own";
    if (random.chance(0.4)) {
      overlay.relabelled = true;
      overlay.sessionID = random.chance(0.3) ? nullptr : &label;
      flat.erase("_sessionID");
      if (overlay.sessionID != nullptr) flat.set("_sessionID", label);
    }
    std::shared_ptr<const RecordLayer> flushLayer;
    if (random.chance(0.5)) {
      auto merged = std::make_shared<Dictionary>(userInfo && random.chance(0.7) ? *userInfo : random.dictionary(4));
      filters.filterEvent(*merged);
      flat.merge(*merged);
      flushLayer = userInfo && *merged == *userInfo ? layer : RecordLayer::of(merged);  // as a flush without rules does
      overlay.userInfo = flushLayer.get();
    }

    Dictionary expected;
    std::size_t removed = 0;
    for (const auto& [key, value] : flat) {
      std::string json;
      if (appendFieldValue(json, value)) {
        expected.set(key, *platform::parseJson(json));
      } else {
        ++removed;
      }
    }
    const LogCapture log;
    const Dictionary compact = parsed(write(record, FieldWriter::Form::compact, overlay));
    ASSERT_EQ(log.count(kRemovedLine), removed) << seed;
    ASSERT_EQ(Value(compact), Value(expected)) << seed;
    ASSERT_EQ(Value(parsed(write(record, FieldWriter::Form::pretty, overlay))), Value(compact)) << seed;
  }
}

TEST_F(EventRecordTest, Message) {
  Array rules;
  for (const auto name : kReservedKeyNames) rules.emplace_back(Dictionary{{"key", name}, {"action", "remove"}});
  const auto filters = EventFilters::createFiltersFromArray(rules);
  EventRecord record(fieldsOf(defaultIdentity()), {.payload = shared({{"a", 1}})}, "own", 0);
  EventRecord nothing(fieldsOf(defaultIdentity()), {}, "own", 0);
  record.prepare(nullptr, *filters);
  nothing.prepare(nullptr, *filters);
  EXPECT_EQ(nothing.category(), 0);
  const OutgoingEvent events[] = {{&record, {}}, {&nothing, {}}};
  const auto message = createMessageForPostAndLogging(1700000000.25, "ID\"1", events, true);
  EXPECT_EQ(message.json, R"({"postTime":1700000000.25,"clientId":"ID\"1","events":[{"a":1},{}]})");
  EXPECT_EQ(parsed(message.prettyJsonString.value_or("")), parsed(message.json));
  const auto bare = createMessageForPostAndLogging(std::nan(""), "x", {}, false);
  EXPECT_EQ(parsed(bare.json), (Dictionary{{"postTime", -1}, {"clientId", "x"}, {"events", Array{}}}));
  EXPECT_FALSE(bare.prettyJsonString);
}

}  // namespace
}  // namespace orvanta::test
