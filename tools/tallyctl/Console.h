// What the person or script that runs the tool gets to read.
#pragma once

#include <chrono>
#include <mutex>
#include <ostream>
#include <string>
#include <string_view>

#include "platform/Value.h"

namespace tallyd::tallyctl {

/// What the standard output holds.
enum class OutputForm {
  Text,
  JSON,  ///< One object on each line.
};

/// Results on the standard output, complaints and progress on the standard error. Every line leaves at once.
///
/// Threading: any thread.
class Console {
 public:
  enum class Progress { Hidden, Shown };

  /// Borrows both streams. Progress is for terminals only: it is a line that is written over.
  Console(std::ostream& out, std::ostream& err, Progress progress, OutputForm form = OutputForm::Text)
      : _out(out), _err(err), _progress(progress), _form(form) {}

  void print(std::string_view line);
  /// What stands in it has a form in JSON.
  void printObject(const platform::Dictionary& object);
  /// The one of the two that the output holds.
  void tell(std::string_view line, const platform::Dictionary& object);
  void note(std::string_view line);      ///< On the standard error, as it stands.
  void complain(std::string_view line);  ///< The same after "tallyctl: ".
  void showProgress(std::string_view text);
  void showElapsed(std::string_view subject, std::chrono::duration<double> time);
  void clearProgress();

  [[nodiscard]] bool isJSON() const { return _form == OutputForm::JSON; }
  [[nodiscard]] bool showsProgress() const { return _progress == Progress::Shown; }
  /// Whether the standard output did not take something.
  [[nodiscard]] bool failed() const;
  /// Why, as errno; 0 when that is not known.
  [[nodiscard]] int outputError() const;

 private:
  void eraseProgress();

  mutable std::mutex _mutex;
  std::ostream& _out;
  std::ostream& _err;
  const Progress _progress;
  const OutputForm _form;
  bool _progressStands = false;
  int _outputError = 0;
};

}  // namespace tallyd::tallyctl
