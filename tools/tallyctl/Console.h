// What the person or script that runs the tool gets to read.
#pragma once

#include <mutex>
#include <ostream>
#include <string>
#include <string_view>

namespace tallyd::tallyctl {

/// Lines on the standard output, complaints and progress on the standard error. Every line leaves at once.
///
/// Threading: any thread.
class Console {
 public:
  enum class Progress { Hidden, Shown };

  /// Borrows both streams. Progress is for terminals only: it is a line that is written over.
  Console(std::ostream& out, std::ostream& err, Progress progress)
      : _out(out), _err(err), _progress(progress) {}

  void print(std::string_view line);
  void note(std::string_view line);      ///< On the standard error, as it stands.
  void complain(std::string_view line);  ///< The same after "tallyctl: ".
  void showProgress(std::string_view text);
  void clearProgress();

  [[nodiscard]] bool showsProgress() const { return _progress == Progress::Shown; }
  [[nodiscard]] bool failed() const;  ///< Whether the standard output did not take something.

 private:
  void eraseProgress();

  mutable std::mutex _mutex;
  std::ostream& _out;
  std::ostream& _err;
  const Progress _progress;
  bool _progressStands = false;
};

}  // namespace tallyd::tallyctl
