// What a message would make leave the device, by the daemon's own code.

#include "StorebagToolFixture.h"
#include "backends/TallyBackend.h"
#include "platform/JSON.h"
#include "tally-storebag/Documents.h"
#include "tally-storebag/ExplainArguments.h"

namespace tallyd::storebagtool {
namespace {

using testing::HasSubstr;
using testing::Not;

class ExplainTest : public StorebagToolTest {
 protected:
  int explain(const Dictionary& bag, const std::vector<std::string>& more, const std::string& type = "0") {
    std::vector<std::string> line{
        "explain", write("bag.plist", bag), "--category", "3",        "--type", type, "token=xyz", "rtt=12.5",
        "--time",  "1000000000.5",          "--raw",      path("raw")};
    line.insert(line.end(), more.begin(), more.end());
    const int status = run(line);
    EXPECT_EQ(status == 0, _err.empty()) << _err;
    return status;
  }
  int explainClient(const Dictionary& entry, std::vector<std::string> more) {
    more.insert(more.end(), {"--require-user-info", "--client-name", "demo"});
    return explain(bagWithClients({clientEntry({{"client", "other"}}), clientEntry(entry)}), more);
  }
  [[nodiscard]] std::string raw(const std::string& name) const { return fileText(path("raw/" + name)); }
  /// The only event of a posted document.
  [[nodiscard]] Dictionary event(const std::string& name) const {
    const std::string bytes = raw(name);
    const auto json = platform::valueFromJSON(gunzipped(bytes).value_or(bytes)).value;
    EXPECT_TRUE(json) << name;
    if (!json) return {};
    const Array* events = json->dictionary()->array("events");
    EXPECT_TRUE(events && events->size() == 1);
    return events ? *(*events)[0].dictionary() : Dictionary();
  }
  [[nodiscard]] bool isPosted() const { return std::filesystem::exists(path("raw/message-splunk-1.body")); }
};

TEST_F(ExplainTest, ShowsEachRulesVerdictAndTheFilteredDocument) {
  EXPECT_EQ(explainClient({}, {"--country", "DE", "--consent", "yes"}), 0);
  for (const char* line :
       {"  user info: required by the session\n", "  user info: given\n", "  clients: there\n",
        "  clients[0], client \"other\", service (none): does not match client \"demo\", service (none)\n",
        "  clients[1], client (none), service (none): matches client \"demo\", service (none)\n",
        "  consent: given\n", "  locale_whitelist (DE): country \"DE\" passes\n",
        "  device_whitelist (none): device \"desktop\" passes\n", "  filters: 1 rules\n",
        "  sampling_threshold 1: factor 0 passes\n", "  field token: removed\n", "  state: on\n",
        "    POST https://collector.example.com/events\n", "      X-RTC-Client-Name: demo\n",
        "\"rtt\": 12.5"}) {
    EXPECT_THAT(_out, HasSubstr(line));
  }
  const Dictionary posted = event("message-splunk-1.body");
  EXPECT_FALSE(posted.contains("token"));
  EXPECT_EQ(posted.string("_eventNumber"), "2");  // The session's start record is the first.
  EXPECT_EQ(posted.string("_startTS"), "999999960");
  EXPECT_EQ(posted.string("ClientName"), "demo");
}

TEST_F(ExplainTest, ShowsWhichRuleHoldsTheMessageBack) {
  struct Case {
    Dictionary entry;
    std::vector<std::string> device;
    const char* verdict;
  };
  const std::vector<std::string> good{"--country", "DE", "--consent", "yes"};
  for (const Case& refused : {
           Case{{}, {"--country", "DE"}, "consent: not given"},
           Case{{}, {"--country", "FR", "--consent", "yes"}, "country \"FR\" does not pass"},
           Case{{{"device_whitelist", Array{"Kasten"}}}, good, "device \"desktop\" does not pass"},
           Case{{{"filters", 1}}, good, "filters: missing"},
           Case{{{"sampling_threshold", -1}}, good, "sampling_threshold -1: factor 0 does not pass"},
       }) {
    EXPECT_EQ(explainClient(refused.entry, refused.device), 0);
    EXPECT_THAT(_out, HasSubstr(refused.verdict));
    EXPECT_THAT(_out, HasSubstr("state: off: nothing is reported"));
    EXPECT_THAT(_out, HasSubstr("  splunk: nothing leaves the device\n"));
    EXPECT_FALSE(isPosted());
  }
}

TEST_F(ExplainTest, PassesWhatOverridesConsentAndADeviceWithoutACountry) {
  EXPECT_EQ(explainClient({{"override_dnu", 1}}, {}), 0);
  EXPECT_THAT(_out, HasSubstr("consent: not asked for, override_dnu is 1"));
  EXPECT_THAT(_out, HasSubstr("country (none) passes"));
  EXPECT_TRUE(isPosted());
}

TEST_F(ExplainTest, HoldsMessagesBackUntilTheUserInfoIsThere) {
  EXPECT_EQ(explain(bagWithClients({clientEntry()}), {"--require-user-info"}), 0);
  EXPECT_THAT(_out, HasSubstr("user info: not given yet"));
  EXPECT_THAT(_out, HasSubstr("state: pending: events are held back"));
  EXPECT_EQ(explain(bagWithClients({clientEntry({{"client", "x"}})}),
                    {"--require-user-info", "--client-name", "y"}),
            0);
  EXPECT_THAT(_out, HasSubstr("state: pending"));
  EXPECT_FALSE(isPosted());
}

TEST_F(ExplainTest, AsksNoRuleWhereNoUserInfoIsRequired) {
  EXPECT_EQ(explain(bagWithClients({clientEntry()}), {}), 0);
  EXPECT_THAT(_out, HasSubstr("no rule of the bag is asked"));
  EXPECT_THAT(_out, HasSubstr("POST (no URL: the post fails)"));
  EXPECT_EQ(event("message-splunk-1.body").string("token"), "xyz");  // No filters either.
  EXPECT_EQ(explain(bagWithClients({clientEntry()}), {"--https-post-url", "https://here.example.com"}), 0);
  EXPECT_THAT(_out, HasSubstr("POST https://here.example.com"));
}

TEST_F(ExplainTest, TakesTheDeviceAsDescribed) {
  EXPECT_EQ(explain(bagWithClients({clientEntry()}), {"--device-family",
                                                      "Kasten",
                                                      "--product-type",
                                                      "K1",
                                                      "--product-version",
                                                      "",
                                                      "--build-version",
                                                      "9Z",
                                                      "--framework-version",
                                                      "8.3.1",
                                                      "--internal",
                                                      "--environment",
                                                      "release",
                                                      "--client-id",
                                                      "12345678-9ABC-4DEF-8000-00000000ABCD",
                                                      "--session-key",
                                                      "KEY",
                                                      "--timezone-offset",
                                                      "-3600",
                                                      "--session-start",
                                                      "1000000000",
                                                      "--post-time",
                                                      "1000000001.007",
                                                      "--client-type",
                                                      "7"}),
            0);
  const Dictionary posted = event("message-splunk-1.body");
  EXPECT_EQ(posted.string("_productFamily"), "Kasten");
  EXPECT_EQ(posted.string("_productModel"), "K1");
  EXPECT_FALSE(posted.contains("_osVersion"));
  EXPECT_EQ(posted.string("_build"), "9Z");
  EXPECT_EQ(posted.string("_reportVers"), "8.3");
  EXPECT_EQ(posted.string("_internal"), "1");
  EXPECT_EQ(posted.string("_sessionID"), "KEY");
  EXPECT_EQ(posted.string("_sender"), "DH");
  EXPECT_EQ(posted.integer("_timezoneOffset"), -3600);
  EXPECT_EQ(posted.string("_clientTS"), "999999960.500");
  EXPECT_THAT(_out, HasSubstr("\"clientId\": \"12345678-9ABC-4DEF-8000-00000000ABCD\""));
  EXPECT_THAT(_out, HasSubstr("\"postTime\": \"1000000001.  7\""));
  EXPECT_THAT(_out, HasSubstr("X-RTC-Internal-Build: 1"));
  EXPECT_THAT(_out, HasSubstr("storebag dialhouse, version 1, environment release\n"));
}

TEST_F(ExplainTest, ShowsTheDatagramThatTheServerWouldGet) {
  const Dictionary bag =
      bagWithSection({{"dashboard", Dictionary{{"ip", "192.0.2.1"}, {"port", 9}, {"reliable", 1}}}});
  EXPECT_EQ(explain(bag, {"--session-id", "258", "--all"}), 0);
  const std::string datagram = raw("message-dashboard-1.datagram");
  ASSERT_GE(datagram.size(), 64U);
  EXPECT_EQ(datagram.substr(64), " token=xyz rtt=12.5");
  EXPECT_EQ(datagram.substr(8, 4), "\xFF\xFF\xFE\xFD");
  EXPECT_EQ(datagram.substr(60, 4),
            std::string("\0\2\0\1", 4));  // The second message; reliable, with a profile.
  EXPECT_TRUE(std::filesystem::exists(path("raw/start-dashboard-1.datagram")));
  EXPECT_TRUE(std::filesystem::exists(path("raw/end-dashboard-1.datagram")));
  EXPECT_THAT(_out, HasSubstr("datagram of " + std::to_string(datagram.size()) + " bytes"));
  EXPECT_THAT(_out, HasSubstr("the client hears: "));
}

TEST_F(ExplainTest, SaysWhyABackendIsNotMade) {
  const Dictionary bag = bagWithSection({{"dashboard", Dictionary{{"ip", "192.0.2.1"}}},
                                         {"splunk", Dictionary()},
                                         {"unknown", Dictionary()},
                                         {"pith", Dictionary()}});
  EXPECT_EQ(explain(bag, {}), 0);
  EXPECT_THAT(_out,
              HasSubstr("backend dashboard\n  is not made\n  log, level 3: Tally(DashboardBackend): can't "
                        "resolve server port\n"));
  EXPECT_THAT(_out, HasSubstr("can't find the client list"));
  EXPECT_THAT(_out, HasSubstr("log, level 3: TallyBackend(newBackendWithName): unknown"));
  EXPECT_THAT(_out, HasSubstr("No matching bundle found for client type 5"));
}

TEST_F(ExplainTest, ShowsThePowerLogsEventAndTheAdaptorsCall) {
  const Dictionary bag = bagWithSection({{"power", Dictionary()}, {"pith", Dictionary()}});
  EXPECT_EQ(explain(bag, {"--client-type", "7"}), 0);
  EXPECT_THAT(
      _out, HasSubstr("power log event 28 StagehostD-RTC: {event = 2; method = 3; respCode = 0; rtt = 12.5; "
                      "token = xyz; }"));
  EXPECT_THAT(_out, HasSubstr("adaptor call: method 3, respCode 0, payload {rtt = 12.5; token = xyz; }"));
  EXPECT_EQ(platform::propertyListWithData(raw("message-pith-1.plist")).value,
            Value(Dictionary{{"rtt", 12.5}, {"token", "xyz"}}));
}

TEST_F(ExplainTest, FlushesTheBatchOfASessionThatBatches) {
  EXPECT_EQ(explainClient({}, {"--country", "DE", "--consent", "yes", "--batch"}), 0);
  EXPECT_FALSE(isPosted());
  const std::string bytes = raw("flush-splunk-1.body");
  const auto json = platform::valueFromJSON(gunzipped(bytes).value_or(bytes)).value;
  ASSERT_TRUE(json);
  EXPECT_EQ(json->dictionary()->array("events")->size(), 2U);  // With the start record.
}

TEST_F(ExplainTest, ShowsTheDeviceIDWhereTheBagAsksForIt) {
  const std::string id(40, 'd');
  EXPECT_EQ(explainClient({{"extras_on_internal", 1}, {"override_dnu", 1}},
                          {"--internal", "--environment", "release", "--device-id", id}),
            0);
  EXPECT_THAT(_out, HasSubstr("\"clientId\": \"" + id + "\""));
}

TEST_F(ExplainTest, SaysWhyTheDeviceGetsNoStorebag) {
  EXPECT_EQ(explain(bagWithSection({}), {"--environment", "development"}), 1);
  EXPECT_THAT(_err,
              HasSubstr("bag.plist: Could not find storebag for client type 5 with development environment"));
  EXPECT_EQ(explain({{"release", Dictionary()}}, {}), 1);
  EXPECT_THAT(_err, HasSubstr("the bag has no \"version\": it ends the daemon"));
}

TEST_F(ExplainTest, GivesSeedBuildsTheReleaseSection) {
  EXPECT_EQ(explain(bagWithSection({{"power", Dictionary()}}), {"--environment", "seed"}), 0);
  EXPECT_THAT(_out, HasSubstr("environment seed"));
  EXPECT_THAT(_out, HasSubstr("backend power"));
}

TEST_F(ExplainTest, RefusesWhatItCannotRead) {
  const auto refuses = [&](const std::vector<std::string>& more) {
    std::vector<std::string> line{"explain", "bag", "--category", "1", "--type", "0"};
    line.insert(line.end(), more.begin(), more.end());
    return run(line) == 2;
  };
  for (const std::vector<std::string>& more :
       std::vector<std::vector<std::string>>{{"--client-type", "4"},
                                             {"--client-type", "12"},
                                             {"--consent", "maybe"},
                                             {"--environment", "x"},
                                             {"--time", "now"},
                                             {"--client-id", "x"},
                                             {"--device-id", "short"},
                                             {"--sampling-factor", "2"},
                                             {"payload"}}) {
    EXPECT_TRUE(refuses(more)) << more[0];
  }
  EXPECT_EQ(run({"explain", "bag", "--type", "0"}), 2);
}

TEST(ExplainArgumentsTest, ReadsTimesToTheMicrosecond) {
  using std::chrono::microseconds;
  EXPECT_EQ(timeFromText("1.5"), platform::TimePoint(microseconds(1'500'000)));
  EXPECT_EQ(timeFromText("1700000000.000001"), platform::TimePoint(microseconds(1'700'000'000'000'001)));
  EXPECT_EQ(timeFromText("0"), platform::TimePoint());
  for (const char* text : {"", ".", ".5", "1.", "-1", "1.-5", "1.0000001", "1e3", "99999999999", "1 "}) {
    EXPECT_EQ(timeFromText(text), std::nullopt) << text;
  }
}

TEST(ExplainArgumentsTest, ReadsUUIDsOnly) {
  const auto bytes = uuidFromText("00112233-4455-6677-8899-aAbBcCdDeEfF");
  ASSERT_TRUE(bytes);
  EXPECT_EQ(platform::uuidText(*bytes), "00112233-4455-6677-8899-AABBCCDDEEFF");
  for (const char* text : {"", "00112233-4455-6677-8899-aabbccddeef", "00112233-4455-6677-8899-aabbccddeefg",
                           "001122334-455-6677-8899-aabbccddeeff", "00112233-4455-6677-8899-aabbccddee+f"}) {
    EXPECT_EQ(uuidFromText(text), std::nullopt) << text;
  }
}

TEST(DocumentsTest, IndentsJSONWithoutChangingIt) {
  EXPECT_EQ(indentedJSON(R"({"b":1.50,"a":[true,null,"x\u0001"]})"),
            "{\n  \"b\": 1.50,\n  \"a\": [\n    true,\n    null,\n    \"x\\u0001\"\n  ]\n}");
  EXPECT_EQ(indentedJSON("no JSON"), "no JSON");
}

TEST(DocumentsTest, TakesNothingOutOfWhatIsNoGzip) {
  EXPECT_EQ(gunzipped(""), std::nullopt);
  EXPECT_EQ(gunzipped("plain"), std::nullopt);
}

}  // namespace
}  // namespace tallyd::storebagtool
