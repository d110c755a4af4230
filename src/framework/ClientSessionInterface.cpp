#include "framework/ClientSessionInterface.h"

namespace tallyd {

const platform::Interface& clientSessionInterface() {
  static const platform::Interface kInterface{
      .objectPath = "/com/quillon/tallyd",
      .name = "com.quillon.tallyd.ClientSessionInterface",
      .methods = {
          {"SetSessionInfo",
           "aa{sv}aa{sv}as",
           {"sessionInfo", "userInfo", "frameworksToCheck"},
           "s",
           {"reply"}},
          {"StartConfig", "", {}, "aas", {"states"}},
          {"FetchStates", "aa{sv}", {"userInfo"}, "aas", {"states"}},
          {"FetchDisplayURL", "", {}, "s", {"displayURL"}},
          {"SendMessageWithCategory", "qqaa{sv}", {"category", "type", "payload"}, "as", {"result"}},
          {"FlushMessages", "", {}, "as", {"result"}},
          {"UploadFileAtPath", "ssah", {"fileURL", "extensionToken", "grant"}, "b", {"uploaded"}},
          {"UploadLogData", "av", {"logData"}, "bas", {"uploaded", "error"}},
          {"SendMessageWithSessionInfo",
           "aa{sv}aa{sv}qqaa{sv}",
           {"sessionInfo", "userInfo", "category", "type", "payload"},
           "s",
           {"reply"}},
      }};
  return kInterface;
}

std::filesystem::path tallydSocketPath(const platform::Root& root) {
  return root.under("/run/tallyd/com.quillon.tallyd");
}

}  // namespace tallyd
