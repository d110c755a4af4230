#include "platform/code-bundles/DlopenCodeBundles.h"

#include <dlfcn.h>

#include "platform/settings/FileBundle.h"
#include "platform/settings/FileReading.h"

namespace tallyd::platform {

namespace {

constexpr std::string_view kExecutableKey = "CFBundleExecutable";
constexpr const char* kExecutableExtension = ".so";

struct LibraryCloser {
  void operator()(void* library) const { ::dlclose(library); }
};
using Library = std::unique_ptr<void, LibraryCloser>;

class DlopenCodeBundle final : public CodeBundle {
 public:
  explicit DlopenCodeBundle(Library library) : _library(std::move(library)) {}

  [[nodiscard]] const void* symbol(const char* name) const override {
    return _library ? ::dlsym(_library.get(), name) : nullptr;
  }

 private:
  const Library _library;
};

/// Why `path` can't be a library; nothing when it may be one. The loader would wait for a pipe's other end.
std::optional<std::string> problemWith(const std::filesystem::path& path) {
  std::error_code error;
  const auto status = std::filesystem::status(path, error);
  if (error) return error.message();
  if (!std::filesystem::is_regular_file(status)) return "not a regular file";
  return std::nullopt;
}

/// The library, or null and the reason in `problem`.
Library loadLibrary(const std::filesystem::path& path, std::string& problem) {
  if (auto known = problemWith(path)) {
    problem = std::move(*known);
    return nullptr;
  }
  Library library(::dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL | RTLD_NODELETE));
  if (!library) {
    const char* error = ::dlerror();
    problem = error ? error : "unknown error";
  }
  return library;
}

}  // namespace

std::shared_ptr<CodeBundle> DlopenCodeBundles::load(const std::filesystem::path& path) {
  const auto executable = executableOf(path);
  std::string problem;
  Library library = loadLibrary(executable, problem);
  if (!library) {
    asl_log(_log, LogLevel::Warning, "Can't load code bundle {}: {}", executable.string(), problem);
  }
  return std::make_shared<DlopenCodeBundle>(std::move(library));
}

std::filesystem::path DlopenCodeBundles::executableOf(const std::filesystem::path& path) const {
  const auto name = FileBundle(path, _log).infoValue(kExecutableKey);
  const auto text = name ? name->string() : std::nullopt;
  if (text && isPlainFileName(*text)) return path / *text;
  // A path that ends in a slash has no last component of its own.
  const auto folder = path.has_filename() ? path : path.parent_path();
  return path / (folder.stem().string() + kExecutableExtension);
}

}  // namespace tallyd::platform
