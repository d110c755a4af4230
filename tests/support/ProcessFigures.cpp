#include "support/ProcessFigures.h"

#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>
#include <stdexcept>
#include <string>

namespace tallyd::test {

namespace {

double processorSeconds(const std::filesystem::path& folder) {
  std::ifstream file(folder / "stat");
  std::string text(std::istreambuf_iterator<char>(file), {});
  // The name is in parentheses and may hold anything; proc(5) counts fields from there on.
  std::istringstream fields(text.substr(text.rfind(')') + 1));
  constexpr int kFieldsBeforeUserTime = 11;
  std::string passedOver;
  for (int i = 0; i < kFieldsBeforeUserTime; ++i) fields >> passedOver;
  double user = 0;
  double system = 0;
  fields >> user >> system;
  return (user + system) / static_cast<double>(::sysconf(_SC_CLK_TCK));
}

}  // namespace

ProcessFigures figuresOf(pid_t process) {
  const std::filesystem::path folder = "/proc/" + std::to_string(process);
  ProcessFigures figures;
  std::ifstream status(folder / "status");
  for (std::string line; std::getline(status, line);) {
    std::istringstream fields(line);
    std::string name;
    std::size_t number = 0;
    fields >> name >> number;
    constexpr std::size_t kKibibyte = 1024;
    if (name == "VmRSS:") figures.residentBytes = number * kKibibyte;
    if (name == "VmHWM:") figures.peakBytes = number * kKibibyte;
    if (name == "VmSize:") figures.addressBytes = number * kKibibyte;
    if (name == "Threads:") figures.threads = number;
  }
  if (figures.threads == 0) throw std::runtime_error("no process " + std::to_string(process));
  for (const auto& entry : std::filesystem::directory_iterator(folder / "fd")) {
    static_cast<void>(entry);
    ++figures.descriptors;
  }
  figures.processorSeconds = processorSeconds(folder);
  return figures;
}

}  // namespace tallyd::test
