// A real browser without a window, for tests of pages.
#pragma once

#include <sys/types.h>

#include <memory>
#include <string>
#include <vector>

#include "fakes/TemporaryFolder.h"
#include "platform/Value.h"
#include "support/DevToolsPipe.h"

namespace tallyd::test {

/// Chromium with one page, on a profile of its own. It reaches nothing but 127.0.0.1 and takes any
/// certificate. Ends with this object.
///
/// Threading: one thread. Every operation throws std::runtime_error, with the browser's own text where there
/// is one, when it fails.
class HeadlessBrowser {
 public:
  enum class Device { Desktop, Phone };
  enum class ColorScheme { Light, Dark };
  /// In CSS pixels.
  struct Viewport {
    int width = 1200;
    int height = 800;
    Device device = Device::Desktop;
  };

  /// Throws when neither Debian's chromium-headless-shell nor its chromium is installed.
  HeadlessBrowser();
  ~HeadlessBrowser();
  HeadlessBrowser(const HeadlessBrowser&) = delete;
  HeadlessBrowser& operator=(const HeadlessBrowser&) = delete;

  void setViewport(const Viewport& viewport);
  void setColorScheme(ColorScheme scheme);
  /// Returns when the page and what it names are loaded.
  void open(const std::string& url);
  /// The value of a JavaScript expression, or of what it promises.
  [[nodiscard]] platform::Value evaluate(const std::string& expression);
  /// As text; of null, "(null)".
  [[nodiscard]] std::string evaluateText(const std::string& expression);
  /// Waits until the expression is true of the page; false after 20 s.
  [[nodiscard]] bool waitUntil(const std::string& expression);
  /// A key as DevTools name it, such as "ArrowLeft", pressed and let go.
  void pressKey(const std::string& key);
  /// A mouse that comes to this place of the viewport.
  void moveMouse(double x, double y);
  /// What the viewport shows, as a PNG.
  [[nodiscard]] std::string screenshot();

  /// Every URL that was asked for since the construction, as far as operations have seen it.
  [[nodiscard]] const std::vector<std::string>& requestedURLs() const { return _requestedURLs; }
  /// Errors and warnings of pages: exceptions, refused content, failed loads.
  [[nodiscard]] const std::vector<std::string>& problems() const { return _problems; }

 private:
  void start(const std::string& program);
  void attach();
  void takeEvent(const std::string& method, const platform::Dictionary& parameters);

  const fakes::TemporaryFolder _profile;
  pid_t _pid = -1;
  std::unique_ptr<DevToolsPipe> _pipe;
  std::vector<std::string> _requestedURLs;
  std::vector<std::string> _problems;
};

}  // namespace tallyd::test
