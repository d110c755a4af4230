#include "backends/https-post/EventFilters.h"

#include <gtest/gtest.h>

namespace tallyd {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;

// SHA-256 by a command-line tool.
constexpr const char* kSHA256OfSecretToken =
    "930bbdc51b6aed5c2a5678fd6e28dee7a05e8a4b643cfc0b4427c3efb86c0d94";
constexpr const char* kSHA256Of5 = "ef2d127de37b942baad06145e54b0c619a1f22327b2ebbcfbec78f5564afe39d";
constexpr const char* kSHA256Of1Point5 = "9f29a130438b81170b92a42650f9a94291ecad60bd47af2a3886e75f7f728725";
constexpr const char* kSHA256OfList = "f376bdd5c266b33c8a59494421dfc89f42d54af80cd4a73f29b8f6b06cc8c5ea";

Dictionary rule(std::string_view key, std::string_view action) { return {{"key", key}, {"action", action}}; }

Dictionary filtered(const EventFilters& filters, const Dictionary& event) {
  EventFields fields(event);
  filters.filterEvent(fields);
  return fields.dictionary();
}

Dictionary filtered(const Array& rules, const Dictionary& event) {
  EventFilters filters;
  filters.createFiltersFromArray(rules);
  return filtered(filters, event);
}

Dictionary event(int method, int status = 0) {
  return {
      {"_method", std::to_string(method)}, {"_status", std::to_string(status)}, {"token", "secret-token"}};
}

TEST(EventFiltersTest, LosesTheTokenOfMethod5AndHashesItElsewhereWithTwoFiltersForTheKey) {
  const Array rules{Dictionary{{"key", "token"}, {"method", 5}, {"action", "remove"}},
                    rule("token", "sha256")};
  EXPECT_FALSE(filtered(rules, event(5)).contains("token"));
  EXPECT_EQ(filtered(rules, event(6)).string("token"), kSHA256OfSecretToken);
}

TEST(EventFiltersTest, CountsOnlyTheFirstRuleThatFits) {
  EXPECT_EQ(filtered({rule("token", "sha256"), rule("token", "remove")}, event(5)).string("token"),
            kSHA256OfSecretToken);
  EXPECT_EQ(filtered({rule("token", "none"), rule("token", "remove")}, event(5)), event(5));
}

TEST(EventFiltersTest, MatchesKeysWhateverTheirCase) {
  EXPECT_FALSE(filtered({rule("TOKEN", "remove")}, event(5)).contains("token"));
  EXPECT_EQ(filtered({rule("äpfel", "remove")}, {{"ÄPFEL", 1}}), Dictionary());
  EXPECT_EQ(filtered({rule("toke", "remove"), rule("token ", "remove")}, event(5)), event(5));
}

TEST(EventFiltersTest, FitsMethodAndStatusBoth) {
  const Array rules{Dictionary{{"key", "token"}, {"method", 5}, {"status", 2}, {"action", "remove"}}};
  EXPECT_FALSE(filtered(rules, event(5, 2)).contains("token"));
  EXPECT_TRUE(filtered(rules, event(5, 3)).contains("token"));
  EXPECT_TRUE(filtered(rules, event(4, 2)).contains("token"));
}

TEST(EventFiltersTest, TakesEveryNegativeMethodOrStatusForAny) {
  const Array rules{Dictionary{{"key", "token"}, {"method", -7}, {"status", -1}, {"action", "remove"}}};
  EXPECT_FALSE(filtered(rules, event(65'535, 65'535)).contains("token"));
}

TEST(EventFiltersTest, ReadsRuleNumbersThatAreText) {
  const Array rules{Dictionary{{"key", "token"}, {"method", "5"}, {"status", " 2"}, {"action", "remove"}}};
  EXPECT_FALSE(filtered(rules, event(5, 2)).contains("token"));
  EXPECT_TRUE(filtered(rules, event(5, 0)).contains("token"));
}

TEST(EventFiltersTest, TakesAnEventWithoutMethodAndStatusForZero) {
  const Array rules{Dictionary{{"key", "token"}, {"method", 0}, {"status", 0}, {"action", "remove"}}};
  EXPECT_EQ(filtered(rules, {{"token", "x"}}), Dictionary());
}

TEST(EventFiltersTest, KnowsItsActionsByTheirExactNames) {
  EventFilters filters;
  filters.createFiltersFromArray({rule("a", "remove"), rule("b", "sha256"), rule("c", "Remove"),
                                  rule("d", "SHA256"), rule("e", ""), Dictionary{{"key", "f"}},
                                  Dictionary{{"key", "g"}, {"action", 1}}});
  std::vector<std::int32_t> actions;
  for (const filterTag& tag : filters.rules()) actions.push_back(tag.action);
  EXPECT_EQ(actions, (std::vector<std::int32_t>{FilterActionRemove, FilterActionSHA256, FilterActionNone,
                                                FilterActionNone, FilterActionNone, FilterActionNone,
                                                FilterActionNone}));
}

TEST(EventFiltersTest, CompilesTheRulesInTheirOrder) {
  EventFilters filters;
  filters.createFiltersFromArray({Dictionary{{"key", "B"}, {"method", 3}, {"action", "remove"}},
                                  Dictionary{{"key", "a"}, {"status", 9}}});
  ASSERT_EQ(filters.rules().size(), 2U);
  EXPECT_EQ(filters.rules()[0].key, "B");
  EXPECT_EQ(filters.rules()[0].method, 3);
  EXPECT_EQ(filters.rules()[0].status, -1);
  EXPECT_EQ(filters.rules()[0].action, FilterActionRemove);
  EXPECT_EQ(filters.rules()[1].key, "a");
  EXPECT_EQ(filters.rules()[1].method, -1);
  EXPECT_EQ(filters.rules()[1].status, 9);
  EXPECT_EQ(filters.rules()[1].action, FilterActionNone);
}

TEST(EventFiltersTest, HashesAValueThatIsNoTextAsItsDescription) {
  const Array rules{rule("n", "sha256"), rule("r", "sha256"), rule("l", "sha256")};
  const Dictionary result = filtered(rules, {{"n", 5}, {"r", 1.5}, {"l", Array{"a", "b"}}});
  EXPECT_EQ(result.string("n"), kSHA256Of5);
  EXPECT_EQ(result.string("r"), kSHA256Of1Point5);
  EXPECT_EQ(result.string("l"), kSHA256OfList);
}

TEST(EventFiltersTest, ChoosesByTheMethodThatTheEventHadAlsoWhenARuleTakesItAway) {
  const Array rules{Dictionary{{"key", "_method"}, {"action", "remove"}},
                    Dictionary{{"key", "_status"}, {"action", "sha256"}},
                    Dictionary{{"key", "token"}, {"method", 5}, {"status", 2}, {"action", "remove"}}};
  const Dictionary result = filtered(rules, event(5, 2));
  EXPECT_FALSE(result.contains("_method"));
  EXPECT_FALSE(result.contains("token"));
  EXPECT_EQ(result.string("_status")->size(), 64U);
}

TEST(EventFiltersTest, HashesAFieldThatIsJSONAlreadyAnew) {
  EventFilters filters;
  filters.createFiltersFromArray({rule("token", "sha256")});
  EventFields fields;
  fields.append({.key = "token", .text = "secret-token", .json = R"("token":"secret-token")"});
  filters.filterEvent(fields);
  ASSERT_NE(fields.find("token"), nullptr);
  EXPECT_EQ(fields.find("token")->text, kSHA256OfSecretToken);
  EXPECT_TRUE(fields.find("token")->json.empty());
}

TEST(EventFiltersTest, ReplacesEarlierRulesButKeepsThemForAnEmptyArray) {
  EventFilters filters;
  filters.createFiltersFromArray({rule("token", "remove")});
  filters.createFiltersFromArray(Array());
  ASSERT_EQ(filters.rules().size(), 1U);
  EXPECT_FALSE(filtered(filters, event(1)).contains("token"));

  filters.createFiltersFromArray({rule("other", "remove")});
  EXPECT_TRUE(filtered(filters, event(1)).contains("token"));
}

TEST(EventFiltersTest, DoesNothingWithoutRules) { EXPECT_EQ(filtered(EventFilters(), event(1)), event(1)); }

TEST(EventFiltersTest, PassesOverRulesThatAreMalformedWithoutHarmToTheNext) {
  const Array rules{Dictionary{{"action", "remove"}},
                    "text",
                    5,
                    Value(),
                    Array{1},
                    Dictionary(),
                    Dictionary{{"key", 7}, {"action", "remove"}},
                    Dictionary{{"key", Value()}, {"action", "remove"}},
                    Dictionary{{"key", "token"}, {"method", Array{5}}, {"action", "remove"}}};
  const Dictionary result = filtered(rules, {{"_method", "5"}, {"token", "x"}, {"", 1}, {"7", 2}});
  EXPECT_EQ(result, (Dictionary{{"_method", "5"}, {"", 1}, {"7", 2}}));
}

TEST(EventFiltersTest, AppliesTheRightOneOfTenThousandRules) {
  std::vector<Value> rules;
  for (int i = 0; i < 10'000; ++i) {
    rules.emplace_back(Dictionary{{"key", "key" + std::to_string(i / 2)},
                                  {"method", i % 2 == 0 ? 5 : -1},
                                  {"action", i % 2 == 0 ? "remove" : "sha256"}});
  }
  EventFilters filters;
  filters.createFiltersFromArray(Array(std::move(rules)));
  EXPECT_EQ(filters.rules().size(), 10'000U);
  const Dictionary removed{{"_method", "5"}, {"key0", "a"}, {"key4999", "b"}, {"key5000", "c"}};
  const Dictionary hashed{{"_method", "6"}, {"KEY4999", "secret-token"}};
  EXPECT_EQ(filtered(filters, removed), (Dictionary{{"_method", "5"}, {"key5000", "c"}}));
  EXPECT_EQ(filtered(filters, hashed).string("KEY4999"), kSHA256OfSecretToken);
}

}  // namespace
}  // namespace tallyd
