// new, show, keys, and what the tool does with a command line that is wrong.

#include "StorebagToolFixture.h"
#include "platform/JSON.h"
#include "tally-storebag/KnownKeys.h"
#include "tally-storebag/StartingBag.h"

namespace tallyd::storebagtool {
namespace {

using testing::HasSubstr;

class BagCommandsTest : public StorebagToolTest {};

TEST_F(BagCommandsTest, WritesABagThatPassesItsOwnCheck) {
  EXPECT_EQ(run({"new", path("bag.plist")}), 0) << _err;
  EXPECT_EQ(run({"lint", path("bag.plist")}), 0);
  EXPECT_EQ(_out, "");
  EXPECT_EQ(run({"new"}), 0);
  EXPECT_EQ(_out, fileText(path("bag.plist")));
}

TEST_F(BagCommandsTest, KeepsABagThatIsThere) {
  write("bag.plist", "mine");
  EXPECT_EQ(run({"new", path("bag.plist")}), 1);
  EXPECT_THAT(_err, HasSubstr(path("bag.plist")));
  EXPECT_EQ(fileText(path("bag.plist")), "mine");
}

TEST_F(BagCommandsTest, StartsWithEveryKeyButTheOtherEnvironmentsAndTheSecondName) {
  for (const KnownKey& key : knownKeys()) {
    if (key.key == "seed" || key.key == "quillon_internal" || key.key == "development" ||
        key.key == "https_post")
      continue;
    EXPECT_THAT(std::string(startingBag()), HasSubstr("<key>" + std::string(key.key) + "</key>"));
  }
}

TEST_F(BagCommandsTest, ShowsABagInBothForms) {
  const Dictionary bag = bagWithSection({{"dashboard", Dictionary{{"ip", "192.0.2.1"}, {"port", 9}}}});
  const auto file = write("bag.plist", bag);
  EXPECT_EQ(run({"show", file}), 0);
  EXPECT_EQ(_out, xml(bag));
  EXPECT_EQ(run({"show", "--format", "json", file}), 0);
  EXPECT_EQ(platform::valueFromJSON(_out).value, Value(bag));
  EXPECT_THAT(_out, HasSubstr("\"port\": 9"));
  EXPECT_EQ(run({"show", write("ascii", "{ version = 1; release = { power = {}; }; }"), "--format", "json"}),
            0);
  EXPECT_THAT(_out, HasSubstr("\"version\": \"1\""));
}

TEST_F(BagCommandsTest, ShowsTheBagOfAnEnvelopeAndSaysThatItDidNotCheck) {
  EXPECT_EQ(run({"keygen", path("keys")}), 0);
  const auto bag = write("bag.plist", bagWithSection({}));
  EXPECT_EQ(run({"sign", bag, "--key", path("keys/privateKey.pem"), "-o", path("envelope")}), 0);
  EXPECT_EQ(run({"show", path("envelope")}), 0);
  EXPECT_EQ(_out, fileText(bag));
  EXPECT_THAT(_err, HasSubstr("its signature is not checked here"));
}

TEST_F(BagCommandsTest, NamesTheFileThatItCannotRead) {
  EXPECT_EQ(run({"show", path("nowhere")}), 1);
  EXPECT_THAT(_err, HasSubstr(path("nowhere")));
  EXPECT_EQ(run({"show", write("text", "<plist")}), 1);
  EXPECT_THAT(_err, HasSubstr(path("text")));
  EXPECT_EQ(run({"lint", write("list", xml(Array{1}))}), 1);
  EXPECT_THAT(_err, HasSubstr(path("list") + ": the property list is not a dictionary"));
  EXPECT_EQ(run({"show", write("e", Dictionary{{"bag", "x"}, {"signature", ""}})}), 1);
  EXPECT_THAT(_err, HasSubstr("\"bag\" is not base64"));
}

TEST_F(BagCommandsTest, ListsEveryKeyOnALineOrInJSON) {
  EXPECT_EQ(run({"keys"}), 0);
  EXPECT_EQ(static_cast<std::size_t>(std::count(_out.begin(), _out.end(), '\n')), knownKeys().size());
  EXPECT_THAT(_out, HasSubstr("sampling_threshold"));
  EXPECT_EQ(run({"keys", "--json"}), 0);
  const auto list = platform::valueFromJSON(_out).value;
  ASSERT_TRUE(list && list->array());
  EXPECT_EQ(list->array()->size(), knownKeys().size());
  EXPECT_EQ((*list->array())[0].dictionary()->string("key"), "version");
}

TEST_F(BagCommandsTest, RefusesAWrongCommandLineWithStatusTwo) {
  for (const std::vector<std::string>& line : std::vector<std::vector<std::string>>{
           {}, {"nothing"}, {"lint"}, {"show", "a", "--format", "ascii"}, {"sign", "a"}, {"diff", "a"}}) {
    EXPECT_EQ(run(line), 2);
    EXPECT_THAT(_err, HasSubstr("tally-storebag: "));
  }
}

TEST_F(BagCommandsTest, HelpsWithAnExampleForEachCommand) {
  for (const char* command : {"new", "keygen", "lint", "sign", "verify", "show", "explain", "diff", "keys"}) {
    EXPECT_EQ(run({command, "--help"}), 0);
    EXPECT_THAT(_out, HasSubstr(std::string("Example:\n  tally-storebag ") + command));
  }
  EXPECT_EQ(run({"--version"}), 0);
  EXPECT_EQ(_out, "tally-storebag 1.2.3\n");
}

TEST(NearestNameTest, FindsASlipAndNoStranger) {
  const auto keys = keysOf(Place::Client);
  EXPECT_EQ(nearestName("locale_witelist", keys), "locale_whitelist");
  EXPECT_EQ(nearestName("Client", keys), "client");
  EXPECT_EQ(nearestName("override-dnu", keys), "override_dnu");
  EXPECT_EQ(nearestName("colour", keys), "");
  EXPECT_EQ(nearestName("", keys), "");
  EXPECT_EQ(nearestName(std::string(10'000, 'x'), keys), "");
}

}  // namespace
}  // namespace tallyd::storebagtool
