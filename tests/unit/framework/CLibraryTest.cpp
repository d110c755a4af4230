// The C functions, over the library that programs link.

#include <gtest/gtest.h>

#include <atomic>
#include <climits>
#include <fstream>
#include <memory>
#include <mutex>
#include <string>
#include <thread>

#include "fakes/TemporaryFolder.h"
#include "tally/tally.h"
#include "unit/framework/PlainC.h"
#include "unit/framework/ScriptedDaemon.h"

namespace tallyd {
namespace {

using platform::Array;
using platform::Data;
using platform::Date;
using platform::Dictionary;
using platform::Value;
using Method = ClientSessionMethod;

struct Free {
  void operator()(tally_reply* reply) const { tally_reply_free(reply); }
  void operator()(tally_value* value) const { tally_value_free(value); }
  void operator()(tally_options* options) const { tally_options_free(options); }
  void operator()(tally_connection* connection) const { tally_disconnect(connection); }
  void operator()(char* text) const { tally_text_free(text); }
};
using Reply = std::unique_ptr<tally_reply, Free>;
using Values = std::unique_ptr<tally_value, Free>;
using Options = std::unique_ptr<tally_options, Free>;
using Connection = std::unique_ptr<tally_connection, Free>;
using Text = std::unique_ptr<char, Free>;

class CLibraryTest : public testing::Test {
 protected:
  Connection connect(const std::function<void(tally_options*)>& change = {}) {
    const Options options(tally_options_new());
    EXPECT_EQ(tally_options_set_socket_path(options.get(), _path.c_str()), TALLY_OK);
    EXPECT_EQ(tally_options_set_pauses(options.get(), 1, 10), TALLY_OK);
    EXPECT_EQ(tally_options_set_close_timeout(options.get(), 200), TALLY_OK);
    if (change) change(options.get());
    return Connection(tally_connect(options.get()));
  }
  static Values json(const char* text) { return Values(tally_value_from_json(text)); }
  static Value some(Value value) { return Value(Array{std::move(value)}); }
  static Value none() { return Value(Array()); }
  ReceivedCall lastCall() { return _daemon.calls(1).back(); }

  fakes::TemporaryFolder _folder;
  const std::filesystem::path _path = _folder.path() / "service";
  ScriptedDaemon _daemon{_path};
};

TEST_F(CLibraryTest, TellsItsVersion) {
  EXPECT_EQ(tally_version(), std::to_string(TALLY_VERSION_MAJOR) + "." + std::to_string(TALLY_VERSION_MINOR) +
                                 "." + std::to_string(TALLY_VERSION_PATCH));
}

TEST_F(CLibraryTest, MakesEveryKindOfValue) {
  const auto connection = connect();
  int answered = 0;
  _daemon.answerWith({some(Value("result"))});
  EXPECT_EQ(plainSend(connection.get(), &answered), TALLY_OK);
  // Answers keep their order.
  const Reply after(tally_flush_messages(connection.get(), TALLY_DEFAULT_TIMEOUT));
  EXPECT_EQ(tally_reply_status(after.get()), TALLY_OK);
  const auto call = _daemon.calls(1).front();
  EXPECT_EQ(answered, 1);
  EXPECT_EQ(call.method, Method::SendMessageWithCategory);
  const Dictionary expected{
      {"speed", 2.5},
      {"list", Array{1, "two"}},
      {"none", Value()},
      {"kinds", Array{-1, ~std::uint64_t{0}, true, 0.5, "text", Date{12.5}, Data(std::string("\0b", 2)),
                      Value(), Dictionary()}},
      {"boolean", false},
      {"integer", 7},
      {"real", 1.25},
      {"text", "ü"},
      {"date", Date{1.5}},
      {"data", Data("bytes")},
      {"json", Array{true}},
  };
  EXPECT_EQ(call.arguments, (std::vector<Value>{3, 65'535, some(Value(expected))}));
}

TEST_F(CLibraryTest, OffersEveryOperation) {
  const auto connection = connect();
  auto* c = connection.get();
  const auto info = json(R"({"SessionID": 7})");
  const char* frameworks[] = {"A", "B"};

  _daemon.answerWith({Value("received")});
  const Reply set(tally_set_session_info(c, info.get(), nullptr, frameworks, 2, TALLY_DEFAULT_TIMEOUT));
  EXPECT_STREQ(tally_reply_text(set.get()), "received");
  EXPECT_EQ(tally_reply_error(set.get()), nullptr);
  EXPECT_EQ(tally_reply_has_list(set.get()), 0);
  EXPECT_EQ(lastCall().arguments,
            (std::vector<Value>{some(Value(Dictionary{{"SessionID", 7}})), none(), Array{"A", "B"}}));

  _daemon.answerWith({some(Value(Array{"dashboard", "splunk"}))});
  const Reply start(tally_start_config(c, TALLY_DEFAULT_TIMEOUT));
  EXPECT_EQ(tally_reply_count(start.get()), 2U);
  EXPECT_STREQ(tally_reply_item(start.get(), 1), "splunk");
  EXPECT_EQ(tally_reply_item(start.get(), 2), nullptr);

  _daemon.answerWith({none()});
  const Reply states(tally_fetch_states(c, info.get(), TALLY_DEFAULT_TIMEOUT));
  EXPECT_EQ(tally_reply_status(states.get()), TALLY_OK);
  EXPECT_EQ(tally_reply_has_list(states.get()), 0);

  _daemon.answerWith({Value("URL")});
  EXPECT_STREQ(tally_reply_text(Reply(tally_fetch_display_url(c, TALLY_DEFAULT_TIMEOUT)).get()), "URL");

  _daemon.answerWith({none()});
  EXPECT_EQ(tally_reply_text(Reply(tally_send_message(c, 1, 2, nullptr, 1'000)).get()), nullptr);
  _daemon.answerWith({some(Value("flushed"))});
  EXPECT_STREQ(tally_reply_text(Reply(tally_flush_messages(c, TALLY_DEFAULT_TIMEOUT)).get()), "flushed");

  const auto file = _folder.path() / "file";
  std::ofstream(file) << "text";
  _daemon.answerWith({Value(true)});
  EXPECT_EQ(tally_reply_truth(Reply(tally_upload_file(c, file.c_str(), TALLY_DEFAULT_TIMEOUT)).get()), 1);
  EXPECT_EQ(lastCall().files.size(), 2U);

  _daemon.answerWith({Value(false), some(Value("no room"))});
  const Reply log(tally_upload_log_data(c, json("[1]").get(), TALLY_DEFAULT_TIMEOUT));
  EXPECT_EQ(tally_reply_truth(log.get()), 0);
  EXPECT_STREQ(tally_reply_text(log.get()), "no room");

  _daemon.answerWith({Value("finished")});
  EXPECT_STREQ(tally_reply_text(Reply(tally_send_message_with_session_info(c, info.get(), nullptr, 1, 2,
                                                                           nullptr, TALLY_DEFAULT_TIMEOUT))
                                    .get()),
               "finished");
  EXPECT_EQ(_daemon.calls(9).size(), 9U);
}

TEST_F(CLibraryTest, OffersEveryOperationWithoutWaiting) {
  const auto file = _folder.path() / "file";
  std::ofstream(file) << "text";
  std::vector<tally_status> taken;
  std::atomic<int> completed = 0;
  const tally_callback callback = [](const tally_reply*, void* context) {
    ++*static_cast<std::atomic<int>*>(context);
  };
  {
    const auto connection = connect();
    auto* c = connection.get();
    const auto info = json("{}");
    constexpr auto kTime = TALLY_DEFAULT_TIMEOUT;
    taken = {
        tally_set_session_info_async(c, info.get(), nullptr, nullptr, 0, kTime, callback, &completed),
        tally_start_config_async(c, kTime, callback, &completed),
        tally_fetch_states_async(c, nullptr, kTime, callback, &completed),
        tally_fetch_display_url_async(c, kTime, callback, &completed),
        tally_send_message_async(c, 1, 2, info.get(), kTime, callback, &completed),
        tally_flush_messages_async(c, kTime, callback, &completed),
        tally_upload_file_async(c, file.c_str(), kTime, callback, &completed),
        tally_upload_log_data_async(c, json("[]").get(), kTime, callback, &completed),
        tally_send_message_with_session_info_async(c, info.get(), nullptr, 1, 2, nullptr, kTime, callback,
                                                   &completed),
        tally_flush_messages_async(c, kTime, nullptr, nullptr),
    };
    const auto calls = _daemon.calls(10);
    for (std::size_t i = 0; i < 10; ++i) EXPECT_EQ(calls[i].expectsReply, i < 9) << i;
  }
  EXPECT_EQ(taken, std::vector<tally_status>(10, TALLY_OK));
  EXPECT_EQ(completed, 9);
}

TEST_F(CLibraryTest, WrongArgumentsAreErrorsWithAText) {
  EXPECT_EQ(tally_value_from_json("{"), nullptr);
  EXPECT_NE(std::string(tally_last_error()).find("not JSON"), std::string::npos);
  EXPECT_EQ(tally_value_from_json(nullptr), nullptr);
  EXPECT_EQ(tally_value_new_text(nullptr), nullptr);
  EXPECT_EQ(tally_value_new_data(nullptr, 1), nullptr);
  const Values dictionary(tally_value_new_dictionary());
  EXPECT_EQ(tally_array_append(dictionary.get(), tally_value_new_null()), TALLY_ERROR_ARGUMENT);
  EXPECT_STREQ(tally_last_error(), "not an array");
  EXPECT_EQ(tally_dictionary_set(dictionary.get(), "key", nullptr), TALLY_ERROR_ARGUMENT);
  EXPECT_EQ(tally_dictionary_set(dictionary.get(), "key", dictionary.get()), TALLY_ERROR_ARGUMENT);
  EXPECT_EQ(tally_dictionary_set(nullptr, "key", tally_value_new_null()), TALLY_ERROR_ARGUMENT);
  EXPECT_EQ(tally_dictionary_set_json(dictionary.get(), "key", "nonsense"), TALLY_ERROR_ARGUMENT);
  EXPECT_STREQ(Text(tally_value_description(dictionary.get())).get(), "{}");
  const Options options(tally_options_new());
  EXPECT_EQ(tally_options_set_timeout(options.get(), -2), TALLY_ERROR_ARGUMENT);
  EXPECT_EQ(tally_options_set_reconnect(options.get(), 5), TALLY_ERROR_ARGUMENT);
  EXPECT_EQ(tally_options_set_socket_path(nullptr, "x"), TALLY_ERROR_ARGUMENT);

  const auto connection = connect();
  const Reply reply(tally_send_message(connection.get(), 1, 2, json("[]").get(), TALLY_DEFAULT_TIMEOUT));
  EXPECT_EQ(tally_reply_status(reply.get()), TALLY_ERROR_ARGUMENT);
  EXPECT_STREQ(tally_reply_error(reply.get()), "not a dictionary");
  EXPECT_EQ(tally_start_config_async(nullptr, 1, nullptr, nullptr), TALLY_ERROR_ARGUMENT);
  EXPECT_STREQ(tally_last_error(), "the connection is NULL");
  EXPECT_EQ(tally_flush_messages_async(connection.get(), -7, nullptr, nullptr), TALLY_ERROR_ARGUMENT);
}

TEST_F(CLibraryTest, GivingBackNothingDoesNothing) {
  tally_value_free(nullptr);
  tally_reply_free(nullptr);
  tally_options_free(nullptr);
  tally_text_free(nullptr);
  tally_disconnect(nullptr);
  EXPECT_EQ(tally_reply_status(nullptr), TALLY_ERROR_MEMORY);
  EXPECT_NE(tally_reply_error(nullptr), nullptr);
}

TEST_F(CLibraryTest, ARefusedCallIsToldByItsStatusOnlyAndTheOthersAreCompletedOnce) {
  std::atomic<int> completed = 0;
  int taken = 0;
  {
    const auto connection =
        connect([](tally_options* options) { tally_options_set_maximum_calls(options, 3); });
    for (int i = 0; i < 10; ++i) {
      const auto status = tally_flush_messages_async(
          connection.get(), TALLY_DEFAULT_TIMEOUT,
          [](const tally_reply*, void* context) { ++*static_cast<std::atomic<int>*>(context); }, &completed);
      EXPECT_TRUE(status == TALLY_OK || status == TALLY_ERROR_REFUSED);
      taken += status == TALLY_OK ? 1 : 0;
    }
    EXPECT_EQ(taken, 3);
  }
  EXPECT_EQ(completed, taken);
}

TEST_F(CLibraryTest, SaysWhyItCannotConnect) {
  const Options options(tally_options_new());
  tally_options_set_socket_path(options.get(), "/nonexistent/service");
  tally_options_set_reconnect(options.get(), TALLY_NEVER_RECONNECT);
  EXPECT_EQ(tally_connect(options.get()), nullptr);
  EXPECT_NE(std::string(tally_last_error()).find("/nonexistent/service"), std::string::npos);
}

TEST_F(CLibraryTest, ACallThatWaitsFailsInACallback) {
  const auto connection = connect();
  _daemon.answerWith({Value("URL")});
  struct Context {
    tally_connection* connection;
    std::atomic<tally_status> status{-1};
  } context{connection.get()};
  tally_fetch_display_url_async(
      connection.get(), TALLY_DEFAULT_TIMEOUT,
      [](const tally_reply*, void* given) {
        auto& own = *static_cast<Context*>(given);
        own.status = tally_reply_status(Reply(tally_fetch_display_url(own.connection, 1'000)).get());
      },
      &context);
  EXPECT_STREQ(tally_reply_text(Reply(tally_fetch_display_url(connection.get(), 30'000)).get()), "URL");
  EXPECT_EQ(context.status, TALLY_ERROR_OWN_THREAD);
}

TEST_F(CLibraryTest, ErrorTextsBelongToTheirThread) {
  EXPECT_EQ(tally_value_from_json("here"), nullptr);
  const std::string here = tally_last_error();
  std::thread([] { EXPECT_STREQ(tally_last_error(), ""); }).join();
  EXPECT_EQ(tally_last_error(), here);
}

}  // namespace
}  // namespace tallyd
