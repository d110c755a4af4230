// Every finding, and the silence about what is well.

#include "StorebagToolFixture.h"
#include "platform/JSON.h"

namespace tallyd::storebagtool {

std::ostream& operator<<(std::ostream& out, const Finding& finding) { return out << textOf(finding); }

namespace {

using testing::Contains;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

constexpr const char* kEntry = "release/splunk/clients[0]";

/// The findings of a bag whose only client entry is `entry`.
Findings ofEntry(const Dictionary& entry) { return lintBag(bagWithClients({entry})); }

Findings ofFilters(const Array& filters) { return ofEntry(clientEntry({{"filters", filters}})); }

Findings ofDashboard(const Dictionary& more, std::string_view without_ = "") {
  Dictionary profile{{"ip", "192.0.2.1"}, {"port", 9}};
  profile.merge(more);
  profile.remove(without_);
  return lintBag(bagWithSection({{"dashboard", profile}}));
}

Dictionary filter(const char* key, const char* action, const Dictionary& more = {}) {
  Dictionary rule{{"key", key}, {"action", action}};
  rule.merge(more);
  return rule;
}

auto isFinding(Severity severity, std::string path, std::string textPart, std::string effectPart) {
  return testing::AllOf(testing::Field(&Finding::severity, severity),
                        testing::Field(&Finding::path, std::move(path)),
                        testing::Field(&Finding::text, HasSubstr(std::move(textPart))),
                        testing::Field(&Finding::effect, HasSubstr(std::move(effectPart))));
}

std::string at(const char* key) { return std::string(kEntry) + "/" + key; }

// The bag and its sections

TEST(LintTest, IsSilentAboutAGoodBag) { EXPECT_THAT(ofEntry(clientEntry()), IsEmpty()); }

TEST(LintTest, MissesTheVersionAndTheSections) {
  const Findings findings = lintBag({});
  EXPECT_THAT(findings,
              Contains(isFinding(Severity::Error, "version", "is missing", "the daemon ends itself")));
  EXPECT_THAT(findings, Contains(isFinding(Severity::Warning, "release", "is missing", "customer builds")));
  EXPECT_THAT(findings, Contains(isFinding(Severity::Error, "", "no section", "no device gets a storebag")));
}

TEST(LintTest, FindsAVersionThatIsNoString) {
  EXPECT_THAT(lintBag({{"version", 1}, {"release", Dictionary{{"power", Dictionary()}}}}),
              Contains(isFinding(Severity::Error, "version", "is a number, not a string", "")));
}

TEST(LintTest, FindsAnUnknownEnvironmentAndAnEmptyOne) {
  const Findings findings =
      lintBag({{"version", "1"}, {"release", Dictionary()}, {"relase", Dictionary()}, {"seed", "x"}});
  EXPECT_THAT(findings,
              Contains(isFinding(Severity::Warning, "relase", "did you mean \"release\"?", "ignored")));
  EXPECT_THAT(findings, Contains(isFinding(Severity::Warning, "release", "is empty", "no backend is made")));
  EXPECT_THAT(findings, Contains(isFinding(Severity::Error, "seed", "is a string, not a dictionary", "")));
}

TEST(LintTest, FindsAnUnknownBackendAndBlanksAroundAName) {
  const Findings findings = lintBag(bagWithSection(
      {{"dashbord", Dictionary()}, {" power", Dictionary()}, {"pith", 1}, {"zzz", Dictionary()}}));
  EXPECT_THAT(findings, Contains(isFinding(Severity::Error, "release/dashbord", "did you mean \"dashboard\"?",
                                           "no backend is made")));
  EXPECT_THAT(findings, Contains(isFinding(Severity::Error, "release/ power", "blanks around \"power\"",
                                           "no backend")));
  EXPECT_THAT(findings, Contains(isFinding(Severity::Error, "release/pith", "is a number", "")));
  EXPECT_THAT(findings,
              Contains(isFinding(Severity::Error, "release/zzz", "nobody reads the key \"zzz\" here", "")));
}

TEST(LintTest, SaysWhatTheSecondNameMeans) {
  const Dictionary post{{"clients", Array{clientEntry()}}};
  EXPECT_THAT(lintBag(bagWithSection({{"https_post", post}})),
              testing::ElementsAre(
                  isFinding(Severity::Note, "release/https_post", "without \"splunk\"", "no hierarchy")));
  EXPECT_THAT(
      lintBag(bagWithSection({{"https_post", post}, {"splunk", post}})),
      testing::ElementsAre(isFinding(Severity::Note, "release/https_post", "beside", "posted by both")));
}

TEST(LintTest, FindsKeysThatABackendWithoutSettingsIgnores) {
  EXPECT_THAT(
      lintBag(bagWithSection({{"power", Dictionary{{"level", 1}}}})),
      testing::ElementsAre(isFinding(Severity::Warning, "release/power/level", "nobody reads", "ignored")));
}

// The dashboard and the upload server

TEST(LintTest, FindsAServerThatIsNoneAtAll) {
  EXPECT_THAT(ofDashboard({}), IsEmpty());
  EXPECT_THAT(ofDashboard({}, "ip"), Contains(isFinding(Severity::Error, "release/dashboard/ip", "is missing",
                                                        "no dashboard backend is made")));
  EXPECT_THAT(ofDashboard({}, "port"),
              Contains(isFinding(Severity::Error, "release/dashboard/port", "is missing", "no dashboard")));
  EXPECT_THAT(
      ofDashboard({{"ip", "host.example.com"}}),
      Contains(isFinding(Severity::Error, "release/dashboard/ip", "not four decimal numbers", "no dashb")));
  EXPECT_THAT(ofDashboard({{"ip", "10.1"}}), Contains(isFinding(Severity::Warning, "release/dashboard/ip",
                                                                "not four", "reads as 10.0.0.1")));
  EXPECT_THAT(ofDashboard({{"ip", "255.255.255.255"}}),
              Contains(isFinding(Severity::Error, "release/dashboard/ip", "broadcast", "no dashboard")));
  EXPECT_THAT(
      ofDashboard({{"ip", "127.0.0.1"}}),
      Contains(isFinding(Severity::Warning, "release/dashboard/ip", "the device itself", "no datagram")));
}

TEST(LintTest, FindsPortsAndPeriodsThatReadOtherwise) {
  EXPECT_THAT(ofDashboard({{"port", 65'535}, {"reliable", 1}}), IsEmpty());
  EXPECT_THAT(ofDashboard({{"port", "4711"}}), IsEmpty());  // As ASCII property lists write numbers.
  for (const int port : {0, -1, 65'536}) {
    EXPECT_THAT(ofDashboard({{"port", port}}),
                Contains(isFinding(Severity::Error, "release/dashboard/port", "not from 1 to 65535",
                                   "reads as " + std::to_string(static_cast<std::uint16_t>(port)))));
  }
  EXPECT_THAT(ofDashboard({{"port", "47x"}}),
              Contains(isFinding(Severity::Error, "release/dashboard/port", "not a number", "reads as 47")));
  EXPECT_THAT(ofDashboard({{"port", 1.5}}), Contains(isFinding(Severity::Warning, "release/dashboard/port",
                                                               "not an integer", "reads as 1")));
  EXPECT_THAT(ofDashboard({{"port", Array()}}), Contains(isFinding(Severity::Error, "release/dashboard/port",
                                                                   "is an array", "as if it were missing")));
  EXPECT_THAT(ofDashboard({{"reliable", 0}}),
              Contains(isFinding(Severity::Warning, "release/dashboard/reliable", "not above 0", "8000 ms")));
}

TEST(LintTest, FindsURLsThatNothingCanBePostedTo) {
  const auto ofURL = [](const char* url) { return ofDashboard({{"post_url", url}}); };
  const std::string path = "release/dashboard/post_url";
  EXPECT_THAT(ofURL("https://a.example.com/x?y=1"), IsEmpty());
  EXPECT_THAT(ofURL("http://a.example.com"),
              Contains(isFinding(Severity::Warning, path, "is http", "can be read")));
  EXPECT_THAT(ofURL("ftp://a.example.com"), Contains(isFinding(Severity::Error, path, "is ftp", "fails")));
  for (const char* broken : {"a.example.com/x", "https://", "https://a b/", ""}) {
    EXPECT_THAT(ofURL(broken), Contains(isFinding(Severity::Error, path, "is no URL", "fails"))) << broken;
  }
  EXPECT_THAT(ofEntry(clientEntry({{"post_url", "nothing"}})),
              Contains(isFinding(Severity::Error, at("post_url"), "is no URL", "fails")));
}

TEST(LintTest, FindsUploadURLsThatFilesCannotGoTo) {
  const auto ofURL = [](const Value& url) {
    return lintBag(bagWithSection({{"upload_server", Dictionary{{"post_url", url}}}}));
  };
  const std::string path = "release/upload_server/post_url";
  EXPECT_THAT(ofURL("https://a.example.com/x"), IsEmpty());
  EXPECT_THAT(ofURL("https://a.example.com/x?a=b"),
              Contains(isFinding(Severity::Warning, path, "question mark", "another one")));
  EXPECT_THAT(ofURL("https://a.example.com/\xC3\xA4"),
              Contains(isFinding(Severity::Error, path, "characters", "no file is uploaded")));
  EXPECT_THAT(ofURL(5),
              Contains(isFinding(Severity::Error, path, "is a number", "no upload backend is made")));
}

// Client entries

TEST(LintTest, FindsWhatTurnsReportingOff) {
  for (const char* key : {"locale_whitelist", "filters", "sampling_threshold"}) {
    EXPECT_THAT(ofEntry(without(clientEntry(), key)),
                Contains(isFinding(Severity::Error, at(key), "is missing", "reporting is off")));
    EXPECT_THAT(ofEntry(clientEntry({{key, Dictionary()}})),
                Contains(isFinding(Severity::Error, at(key), "is a dictionary", "reporting is off")));
  }
  EXPECT_THAT(ofEntry(clientEntry({{"locale_whitelist", Array()}})),
              Contains(isFinding(Severity::Error, at("locale_whitelist"), "is empty", "reporting is off")));
  EXPECT_THAT(ofEntry(clientEntry({{"locale_whitelist", Array{"Germany", ""}}})),
              Contains(isFinding(Severity::Error, at("locale_whitelist"), "no country can match", "off")));
  EXPECT_THAT(ofEntry(clientEntry({{"device_whitelist", Array{"", 5}}})),
              Contains(isFinding(Severity::Error, at("device_whitelist"), "no device can match", "off")));
}

TEST(LintTest, FindsTextsThatMatchOtherwiseThanTheyLook) {
  EXPECT_THAT(ofEntry(clientEntry({{"client", "alpha, beta"}})),
              Contains(isFinding(Severity::Warning, at("client"), "blanks around \" beta\"", "bare name")));
  EXPECT_THAT(ofEntry(clientEntry({{"service", "call ,x"}})),
              Contains(isFinding(Severity::Warning, at("service"), "blanks around \"call \"", "only where")));
  EXPECT_THAT(ofEntry(clientEntry({{"client", "alpha,,beta"}})),
              Contains(isFinding(Severity::Warning, at("client"), "an empty text", "matches nothing")));
  EXPECT_THAT(
      ofEntry(clientEntry({{"locale_whitelist", Array{"DE", "GBR1"}}})),
      Contains(isFinding(Severity::Warning, at("locale_whitelist"), "longer than a country code", "")));
  EXPECT_THAT(ofEntry(clientEntry({{"locale_whitelist", Array{"D"}}})),
              Contains(isFinding(Severity::Note, at("locale_whitelist"), "single letter", "every country")));
  EXPECT_THAT(ofEntry(clientEntry({{"device_whitelist", Array()}})),
              Contains(isFinding(Severity::Note, at("device_whitelist"), "is empty", "every device passes")));
  EXPECT_THAT(
      ofEntry(clientEntry({{"device_whitelist", "Kasten"}})),
      Contains(isFinding(Severity::Error, at("device_whitelist"), "is a string", "every device passes")));
}

TEST(LintTest, FindsNumbersOutOfTheirRange) {
  EXPECT_THAT(ofEntry(clientEntry({{"sampling_threshold", 0.25}})), IsEmpty());
  EXPECT_THAT(ofEntry(clientEntry({{"sampling_threshold", "0.25"}})), IsEmpty());
  EXPECT_THAT(
      ofEntry(clientEntry({{"sampling_threshold", 25}})),
      Contains(isFinding(Severity::Warning, at("sampling_threshold"), "not from 0 to 1", "every session")));
  EXPECT_THAT(ofEntry(clientEntry({{"sampling_threshold", -0.1}})),
              Contains(isFinding(Severity::Error, at("sampling_threshold"), "not from 0 to 1", "off")));
  EXPECT_THAT(ofEntry(clientEntry({{"sampling_threshold", 0}})),
              Contains(isFinding(Severity::Warning, at("sampling_threshold"), "is 0", "just 0")));
  EXPECT_THAT(ofEntry(clientEntry({{"sampling_threshold", "all"}})),
              Contains(isFinding(Severity::Error, at("sampling_threshold"), "not a number", "reads as 0")));
  EXPECT_THAT(ofEntry(clientEntry({{"event_threshold", -1}})),
              Contains(isFinding(Severity::Error, at("event_threshold"), "below 0", "no event is batched")));
  EXPECT_THAT(ofEntry(clientEntry({{"hierarchy", std::int64_t{1} << 32}})),
              Contains(isFinding(Severity::Error, at("hierarchy"), "does not fit 32 bits", "reads as 0")));
}

TEST(LintTest, NotesWhatLeavesWithoutConsentOrWithTheDeviceID) {
  EXPECT_THAT(
      ofEntry(clientEntry({{"override_dnu", 1}})),
      testing::ElementsAre(isFinding(Severity::Note, at("override_dnu"), "is 1", "without the user's")));
  EXPECT_THAT(ofEntry(clientEntry({{"override_dnu", 2}})),
              Contains(isFinding(Severity::Warning, at("override_dnu"), "neither 0 nor 1", "reads as 0")));
  EXPECT_THAT(
      ofEntry(clientEntry({{"extras_on_internal", 1}})),
      testing::ElementsAre(isFinding(Severity::Note, at("extras_on_internal"), "is not 0", "device ID")));
}

TEST(LintTest, FindsUnknownAndMissingKeysOfAnEntry) {
  EXPECT_THAT(ofEntry(clientEntry({{"locale_witelist", Array()}})),
              Contains(isFinding(Severity::Warning, at("locale_witelist"),
                                 "did you mean \"locale_whitelist\"?", "")));
  EXPECT_THAT(ofEntry(without(clientEntry(), "post_url")),
              Contains(isFinding(Severity::Warning, at("post_url"), "is missing", "preferences")));
  EXPECT_THAT(lintBag(bagWithClients({"text", clientEntry()})),
              Contains(isFinding(Severity::Error, kEntry, "is not a dictionary", "ignored")));
}

TEST(LintTest, FindsABagThatNoClientCanMatch) {
  const Findings none = lintBag(bagWithClients({}));
  EXPECT_THAT(none,
              Contains(isFinding(Severity::Error, "release/splunk/clients", "no client can match", "never")));
  const Findings dead = ofEntry(clientEntry({{"client", ""}}));
  EXPECT_THAT(dead, Contains(isFinding(Severity::Error, kEntry, "no client can match", "never chosen")));
  EXPECT_THAT(dead,
              Contains(isFinding(Severity::Error, "release/splunk/clients", "no client can match", "")));
  EXPECT_THAT(
      lintBag(bagWithSection({{"splunk", Dictionary()}})),
      Contains(isFinding(Severity::Error, "release/splunk/clients", "is missing", "no HTTPS post backend")));
}

TEST(LintTest, FindsEntriesThatEarlierOnesHide) {
  const auto second = [](const Dictionary& first, const Dictionary& later) {
    return lintBag(bagWithClients({clientEntry(first), clientEntry(later)}));
  };
  const std::string path = "release/splunk/clients[1]";
  const auto hidden = Contains(isFinding(Severity::Error, path, "clients[0] matches", "never chosen"));
  EXPECT_THAT(second({}, {{"client", "alpha"}}), hidden);
  EXPECT_THAT(second({}, {}), hidden);
  EXPECT_THAT(second({{"client", "ALPHA,beta"}}, {{"client", "alpha"}}), hidden);
  EXPECT_THAT(second({{"service", "call"}}, {{"service", "VideoCall"}}), hidden);
  EXPECT_THAT(second({{"client", "alpha"}}, {{"client", "alpha"}, {"service", "call"}}), hidden);
  EXPECT_THAT(
      second({{"client", "alpha"}}, {{"client", "alpha,gamma"}}),
      Contains(isFinding(Severity::Warning, path, "clients[0] matches \"alpha\"", "not chosen for it")));
  EXPECT_THAT(second({{"client", "alpha"}}, {}), IsEmpty());
  EXPECT_THAT(second({{"service", "VideoCall"}}, {{"service", "call"}}), IsEmpty());
  EXPECT_THAT(second({{"client", "alpha"}, {"service", "a"}}, {{"client", "alpha"}}), IsEmpty());
}

// Filters

TEST(LintTest, FindsRulesThatDoNothing) {
  const std::string path = at("filters") + "[0]";
  EXPECT_THAT(
      ofFilters({filter("a", "Remove")}),
      Contains(isFinding(Severity::Error, path + "/action", "did you mean \"remove\"?", "leaves as it is")));
  EXPECT_THAT(ofFilters({filter("a", "none")}), IsEmpty());
  EXPECT_THAT(ofFilters({Dictionary{{"key", "a"}}}),
              Contains(isFinding(Severity::Warning, path + "/action", "is missing", "leaves as it is")));
  EXPECT_THAT(ofFilters({Dictionary{{"action", "remove"}}}),
              Contains(isFinding(Severity::Error, path + "/key", "is missing", "fits no field")));
  EXPECT_THAT(ofFilters({filter(" a", "remove")}),
              Contains(isFinding(Severity::Warning, path + "/key", "blanks around", "bare field")));
  EXPECT_THAT(ofFilters({filter("", "remove")}),
              Contains(isFinding(Severity::Warning, path + "/key", "is empty", "")));
  EXPECT_THAT(ofFilters({"remove"}),
              Contains(isFinding(Severity::Error, path, "is not a dictionary", "fits no field")));
  EXPECT_THAT(ofFilters({}), testing::ElementsAre(isFinding(Severity::Note, at("filters"), "is empty", "")));
}

TEST(LintTest, FindsMethodsAndStatusesThatReadOtherwise) {
  const std::string path = at("filters") + "[0]";
  EXPECT_THAT(ofFilters({filter("a", "remove", {{"method", "all"}})}),
              Contains(isFinding(Severity::Error, path + "/method", "not a number", "reads as 0")));
  EXPECT_THAT(ofFilters({filter("a", "remove", {{"status", 65'536}})}),
              Contains(isFinding(Severity::Error, path + "/status", "above 65535", "fits no message")));
  EXPECT_THAT(ofFilters({filter("a", "remove", {{"method", -1}})}),
              testing::ElementsAre(isFinding(Severity::Note, path + "/method", "below 0", "every message")));
  EXPECT_THAT(ofFilters({filter("a", "remove", {{"method", Dictionary()}})}),
              Contains(isFinding(Severity::Error, path + "/method", "is a dictionary", "any category")));
}

TEST(LintTest, FindsRulesThatEarlierOnesHide) {
  const std::string path = at("filters") + "[1]";
  EXPECT_THAT(ofFilters({filter("a", "sha256"), filter("A", "remove")}),
              testing::ElementsAre(isFinding(Severity::Error, path, "filters[0] fits all", "never applied")));
  EXPECT_THAT(
      ofFilters({filter("a", "remove"), filter("a", "remove", {{"method", 5}})}),
      testing::ElementsAre(isFinding(Severity::Warning, path, "filters[0] fits all", "never applied")));
  EXPECT_THAT(ofFilters({filter("a", "remove", {{"method", 5}}), filter("a", "sha256")}), IsEmpty());
  EXPECT_THAT(ofFilters({filter("a", "remove"), filter("b", "sha256")}), IsEmpty());
}

// The command

class LintCommandTest : public StorebagToolTest {};

TEST_F(LintCommandTest, FailsOnWarningsAndErrorsAloneAndPrintsThem) {
  EXPECT_EQ(run({"lint", write("bag", bagWithClients({clientEntry()}))}), 0);
  EXPECT_EQ(run({"lint", write("bag", bagWithClients({clientEntry({{"override_dnu", 1}})}))}), 0);
  EXPECT_EQ(_out,
            "note release/splunk/clients[0]/override_dnu: is 1; reports leave without the user's consent\n");
  EXPECT_EQ(run({"lint", write("bag", bagWithClients({clientEntry({{"x", 1}})}))}), 1);
  EXPECT_EQ(run({"lint", write("bag", Dictionary())}), 1);
  EXPECT_THAT(_out,
              HasSubstr("error /: there is no section for any environment; no device gets a storebag\n"));
}

TEST_F(LintCommandTest, PrintsJSON) {
  EXPECT_EQ(run({"lint", "--json", write("bag", bagWithClients({clientEntry({{"override_dnu", 1}})}))}), 0);
  EXPECT_EQ(platform::valueFromJSON(_out).value,
            Value(Array{Dictionary{{"severity", "note"},
                                   {"path", "release/splunk/clients[0]/override_dnu"},
                                   {"text", "is 1"},
                                   {"effect", "reports leave without the user's consent"}}}));
  EXPECT_EQ(run({"lint", "--json", write("bag", bagWithClients({clientEntry()}))}), 0);
  EXPECT_EQ(_out, "[]\n");
}

}  // namespace
}  // namespace tallyd::storebagtool
