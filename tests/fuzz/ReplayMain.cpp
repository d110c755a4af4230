// Runs a fuzz target without a fuzzing engine: over its corpus, and over a fixed number of mutations of it.

#include <csignal>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <iterator>

#include "FuzzTarget.h"
#include "Mutator.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <vector>

namespace fs = std::filesystem;

extern "C" void __sanitizer_set_death_callback(void (*callback)()) __attribute__((weak));

namespace {

using tallyd::fuzz::Mutator;

/// What runs now, for whoever has to tell what ended the process.
struct {
  const char* findingPath = nullptr;
  bool isRunning = false;
  const std::uint8_t* bytes = nullptr;
  std::size_t size = 0;
} running;

/// Uses nothing that a signal handler must not use.
void saveFinding() {
  if (!running.isRunning) return;
  const int file = ::open(running.findingPath, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
  if (file < 0) return;
  const bool isWritten = ::write(file, running.bytes, running.size) == static_cast<ssize_t>(running.size);
  ::close(file);
  const auto say = [](const char* text) { return ::write(STDERR_FILENO, text, std::strlen(text)) >= 0; };
  if (isWritten && say("input saved as ") && say(running.findingPath)) say("\n");
}

extern "C" void onDeadlySignal(int signal) {
  saveFinding();
  std::signal(signal, SIG_DFL);
  std::raise(signal);
}

void run(const std::string& input) {
  // In memory of its own, so that a sanitizer sees whoever reads beyond its end.
  const std::vector<std::uint8_t> copy(input.begin(), input.end());
  running.bytes = copy.data();
  running.size = copy.size();
  running.isRunning = true;
  LLVMFuzzerTestOneInput(copy.data(), copy.size());
  running.isRunning = false;
}

std::string contentsOf(const fs::path& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

/// All inputs of a folder, or the one file, in the order of their names.
std::vector<std::string> inputsAt(const fs::path& place) {
  if (!fs::is_directory(place)) return {contentsOf(place)};
  std::vector<fs::path> paths(fs::directory_iterator(place), fs::directory_iterator{});
  std::sort(paths.begin(), paths.end());
  std::vector<std::string> inputs;
  for (const fs::path& path : paths) inputs.push_back(contentsOf(path));
  return inputs;
}

}  // namespace

/// @param argv  the number of mutations, the file for what ends the process, the dictionary or "-", then
/// folders and files of inputs.
int main(int argc, char** argv) {
  if (argc < 5) {
    std::cerr << "Usage: " << argv[0] << " MUTATIONS FINDING DICTIONARY INPUTS...\n";
    return 2;
  }
  running.findingPath = argv[2];
  for (const int signal : {SIGABRT, SIGSEGV, SIGBUS, SIGFPE, SIGILL}) std::signal(signal, onDeadlySignal);
  if (__sanitizer_set_death_callback != nullptr) __sanitizer_set_death_callback(saveFinding);

  std::vector<std::string> corpus;
  for (int i = 4; i < argc; ++i) {
    for (std::string& input : inputsAt(argv[i])) corpus.push_back(std::move(input));
  }
  if (corpus.empty()) {
    std::cerr << "no inputs\n";
    return 2;
  }
  run("");
  for (const std::string& input : corpus) run(input);

  const bool hasDictionary = std::string_view(argv[3]) != "-";
  Mutator mutator(
      corpus, hasDictionary ? tallyd::fuzz::dictionaryFrom(contentsOf(argv[3])) : std::vector<std::string>());
  const unsigned long mutations = std::strtoul(argv[1], nullptr, 10);
  for (unsigned long i = 0; i < mutations; ++i) run(mutator.next());
  std::cout << corpus.size() << " inputs and " << mutations << " mutations\n";
  return 0;
}
