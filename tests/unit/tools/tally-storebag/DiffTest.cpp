// What starts and stops leaving devices between two bags.

#include "StorebagToolFixture.h"
#include "tally-storebag/BagDiff.h"

namespace tallyd::storebagtool {

std::ostream& operator<<(std::ostream& out, const Change& change) {
  return out << static_cast<int>(change.exposure) << " " << change.path << ": " << change.text;
}

namespace {

using testing::AllOf;
using testing::Contains;
using testing::ElementsAre;
using testing::EndsWith;
using testing::Field;
using testing::HasSubstr;
using testing::IsEmpty;

auto isChange(Exposure exposure, std::string pathEnd, std::string text) {
  return AllOf(Field(&Change::exposure, exposure), Field(&Change::path, EndsWith(std::move(pathEnd))),
               Field(&Change::text, std::move(text)));
}

/// The changes from an entry with `before` to one with `after`.
Changes entries(const Dictionary& before, const Dictionary& after) {
  return diffBags(bagWithClients({clientEntry(before)}), bagWithClients({clientEntry(after)}));
}

Changes filters(const Array& before, const Array& after) {
  return entries({{"filters", before}}, {{"filters", after}});
}

Dictionary rule(const char* key, const char* action, const Dictionary& more = {}) {
  Dictionary filter{{"key", key}, {"action", action}};
  filter.merge(more);
  return filter;
}

TEST(DiffTest, FindsNothingBetweenBagsThatDoTheSame) {
  EXPECT_THAT(entries({}, {}), IsEmpty());
  EXPECT_THAT(entries({{"client", "a,b"}}, {{"client", "B,A"}}), IsEmpty());
  EXPECT_THAT(filters({rule("a", "remove"), rule("b", "sha256")}, {rule("b", "sha256"), rule("A", "remove")}),
              IsEmpty());
  // Two entries in the place of one.
  EXPECT_THAT(diffBags(bagWithClients({clientEntry({{"client", "a,b"}})}),
                       bagWithClients({clientEntry({{"client", "a"}}), clientEntry({{"client", "b"}})})),
              IsEmpty());
}

TEST(DiffTest, FindsFieldsThatStartOrStopLeaving) {
  EXPECT_THAT(filters({rule("a", "remove")}, {}),
              ElementsAre(isChange(Exposure::Grows, "filters", "field \"a\": removed -> plain")));
  EXPECT_THAT(filters({rule("a", "sha256")}, {rule("a", "keep")}),
              ElementsAre(isChange(Exposure::Grows, "filters", "field \"a\": hashed -> plain")));
  EXPECT_THAT(filters({rule("a", "remove")}, {rule("a", "sha256")}),
              ElementsAre(isChange(Exposure::Grows, "filters", "field \"a\": removed -> hashed")));
  EXPECT_THAT(filters({}, {rule("a", "remove")}),
              ElementsAre(isChange(Exposure::Shrinks, "filters", "field \"a\": plain -> removed")));
}

TEST(DiffTest, FindsFieldsThatChangeForSomeMessagesOnly) {
  EXPECT_THAT(filters({rule("a", "remove")}, {rule("a", "remove", {{"method", 5}})}),
              ElementsAre(isChange(Exposure::Grows, "filters",
                                   "field \"a\", method any other, status any other: removed -> plain")));
  // An earlier rule now hides the one that removed.
  EXPECT_THAT(filters({rule("a", "remove")}, {rule("a", "sha256", {{"status", 1}}), rule("a", "remove")}),
              ElementsAre(isChange(Exposure::Grows, "filters",
                                   "field \"a\", method any other, status 1: removed -> hashed")));
}

TEST(DiffTest, FindsCountriesAndDevices) {
  EXPECT_THAT(entries({{"locale_whitelist", Array{"DE", "US"}}}, {{"locale_whitelist", Array{"us", "FR"}}}),
              ElementsAre(isChange(Exposure::Grows, "locale_whitelist", "country \"FR\" starts reporting"),
                          isChange(Exposure::Shrinks, "locale_whitelist", "country \"DE\" stops reporting")));
  EXPECT_THAT(entries({{"device_whitelist", Array{"Kasten"}}}, {}),
              ElementsAre(isChange(Exposure::Grows, "device_whitelist", "every device starts reporting")));
  EXPECT_THAT(entries({}, {{"device_whitelist", Array{"Kasten"}}}),
              ElementsAre(isChange(Exposure::Shrinks, "device_whitelist",
                                   "devices that are not listed stop reporting")));
  EXPECT_THAT(
      entries({{"device_whitelist", Array{"Kasten"}}}, {{"device_whitelist", Array{"Kasten", "Kastenette"}}}),
      IsEmpty());  // Held by the name that was there.
}

TEST(DiffTest, FindsSamplingThresholdsAndTerms) {
  EXPECT_THAT(entries({{"sampling_threshold", 0.1}}, {{"sampling_threshold", 0.2}}),
              ElementsAre(isChange(Exposure::Grows, "sampling_threshold", "0.1 -> 0.2")));
  EXPECT_THAT(entries({{"sampling_threshold", 1}}, {{"sampling_threshold", 5}}), IsEmpty());
  EXPECT_THAT(entries({}, {{"event_threshold", 9}}),
              ElementsAre(isChange(Exposure::Shrinks, "event_threshold", "49 -> 9")));
  EXPECT_THAT(entries({}, {{"override_dnu", 1}}),
              ElementsAre(isChange(Exposure::Grows, "override_dnu",
                                   "reports start to leave without the user's consent")));
  EXPECT_THAT(
      entries({{"override_dnu", 1}}, {{"override_dnu", 2}}),
      ElementsAre(isChange(Exposure::Shrinks, "override_dnu", "reports leave with the user's consent only")));
  EXPECT_THAT(entries({}, {{"extras_on_internal", 1}}),
              ElementsAre(isChange(Exposure::Grows, "extras_on_internal",
                                   "internal builds start to send the device ID")));
  EXPECT_THAT(entries({}, {{"hierarchy", 1}}), ElementsAre(isChange(Exposure::Same, "hierarchy", "0 -> 1")));
}

TEST(DiffTest, FindsOtherDestinations) {
  EXPECT_THAT(entries({{"post_url", "https://a.example.com"}}, {{"post_url", "https://b.example.com"}}),
              ElementsAre(isChange(Exposure::Grows, "post_url",
                                   "posts go to https://b.example.com, not to https://a.example.com")));
  const auto dashboard = [](const Dictionary& more) {
    Dictionary profile{{"ip", "192.0.2.1"}, {"port", 9}};
    profile.merge(more);
    return bagWithSection({{"dashboard", profile}});
  };
  EXPECT_THAT(diffBags(dashboard({}), dashboard({{"port", 10}, {"post_url", "https://a.example.com"}})),
              ElementsAre(isChange(Exposure::Grows, "release/dashboard",
                                   "datagrams go to 192.0.2.1:10, not to 192.0.2.1:9"),
                          isChange(Exposure::Grows, "post_url", "posts go to https://a.example.com")));
  EXPECT_THAT(diffBags(dashboard({}), dashboard({{"reliable", 100}})),
              ElementsAre(isChange(Exposure::Same, "reliable", "(none) -> 100")));
}

TEST(DiffTest, FindsClientsThatStartAndStop) {
  EXPECT_THAT(entries({{"client", "a"}}, {{"client", "a,b"}}),
              ElementsAre(AllOf(isChange(Exposure::Grows, "", "starts reporting"),
                                Field(&Change::path, "release/splunk/(client \"b\", service any other)"))));
  EXPECT_THAT(entries({}, {{"client", "a"}}),
              ElementsAre(AllOf(isChange(Exposure::Shrinks, "", "stops reporting"),
                                Field(&Change::path, HasSubstr("client any other")))));
  // The entry is still there, but nobody reports by it any more.
  EXPECT_THAT(
      diffBags(bagWithClients({clientEntry()}), bagWithClients({without(clientEntry(), "locale_whitelist")})),
      ElementsAre(isChange(Exposure::Shrinks, "", "stops reporting")));
  // An entry in front takes clients over.
  EXPECT_THAT(diffBags(bagWithClients({clientEntry()}),
                       bagWithClients({clientEntry({{"client", "a"}, {"filters", Array()}}), clientEntry()})),
              ElementsAre(AllOf(isChange(Exposure::Grows, "filters", "field \"token\": removed -> plain"),
                                Field(&Change::path, HasSubstr("(client \"a\", service any other)")))));
}

TEST(DiffTest, FindsBackendsThatComeAndGo) {
  const Dictionary both{{"power", Dictionary()},
                        {"upload_server", Dictionary{{"post_url", "https://a.example.com"}}}};
  EXPECT_THAT(diffBags(bagWithSection({}), bagWithSection(both)),
              ElementsAre(isChange(Exposure::Grows, "release/power", "the backend comes anew"),
                          isChange(Exposure::Grows, "release/upload_server", "the backend comes anew")));
  EXPECT_THAT(diffBags(bagWithSection(both), bagWithSection({{"upload_server", Dictionary()}})),
              ElementsAre(isChange(Exposure::Shrinks, "release/power", "the backend goes"),
                          isChange(Exposure::Shrinks, "release/upload_server", "the backend goes")));
  EXPECT_THAT(diffBags(bagWithSection({}), bagWithClients({clientEntry()})),
              Contains(isChange(Exposure::Grows, ")", "starts reporting")));
}

TEST(DiffTest, KnowsThatSeedBuildsGetReleaseWithoutASectionOfTheirOwn) {
  const Dictionary release{{"power", Dictionary()}};
  EXPECT_THAT(diffBags({{"version", "1"}, {"release", release}},
                       {{"version", "1"}, {"release", release}, {"seed", Dictionary()}}),
              ElementsAre(isChange(Exposure::Shrinks, "seed/power", "the backend goes")));
  EXPECT_THAT(diffBags({{"version", "1"}, {"release", release}},
                       {{"version", "2"}, {"release", release}, {"seed", release}}),
              ElementsAre(isChange(Exposure::Same, "version", "1 -> 2")));
}

class DiffCommandTest : public StorebagToolTest {
 protected:
  int diff(const Dictionary& before, const Dictionary& after) {
    return run({"diff", write("old", bagWithClients({clientEntry(before)})),
                write("new", bagWithClients({clientEntry(after)}))});
  }
};

TEST_F(DiffCommandTest, FailsOnlyWhenExposureGrows) {
  EXPECT_EQ(diff({}, {}), 0);
  EXPECT_EQ(_out, "no change in what leaves devices\n");
  EXPECT_EQ(diff({{"sampling_threshold", 1}}, {{"sampling_threshold", 0.5}}), 0);
  EXPECT_THAT(
      _out, HasSubstr("- release/splunk/(client any other, service any other)/sampling_threshold: 1 -> 0.5\n"
                      "exposure only shrinks\n"));
  EXPECT_EQ(diff({{"hierarchy", 1}}, {}), 0);
  EXPECT_THAT(_out, EndsWith("exposure stays\n"));
  EXPECT_EQ(diff({{"sampling_threshold", 0.5}}, {{"sampling_threshold", 1}, {"event_threshold", 1}}), 1);
  EXPECT_THAT(_out, EndsWith("exposure grows\n"));
}

TEST_F(DiffCommandTest, TellsABagThatItCannotReadFromADifference) {
  EXPECT_EQ(run({"diff", path("a"), path("b")}), 2);
  EXPECT_THAT(_err, HasSubstr(path("a")));
}

}  // namespace
}  // namespace tallyd::storebagtool
