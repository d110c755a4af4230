// The client library as it is installed: what it exports, how builds find it, and what the examples do with
// it.

#include <gtest/gtest.h>

#include <fstream>
#include <regex>
#include <sstream>

#include "integration/TestDaemon.h"

namespace tallyd::test {
namespace {

namespace fs = std::filesystem;
using platform::Dictionary;
using platform::Value;

/// Installs the library's two components into a folder, once for all tests.
class InstalledTree {
 public:
  InstalledTree() {
    for (const std::string component : {"library", "development"}) {
      WatchedProcess process({.arguments = {TALLYD_CMAKE, "--install", TALLYD_BUILD_DIR, "--component",
                                            component, "--prefix", prefix().string()}});
      EXPECT_EQ(process.wait().code, 0) << process.output();
    }
  }
  [[nodiscard]] fs::path prefix() const { return _folder.path() / "prefix"; }
  [[nodiscard]] fs::path scratch() const { return _folder.path(); }
  [[nodiscard]] fs::path libraryFolder() const { return prefix() / TALLYD_LIBDIR; }

 private:
  fakes::TemporaryFolder _folder;
};

class ClientLibraryTest : public testing::Test {
 protected:
  static void SetUpTestSuite() { tree = std::make_unique<InstalledTree>(); }
  static void TearDownTestSuite() { tree.reset(); }

  /// What the command writes; it must succeed.
  static std::string run(std::vector<std::string> arguments,
                         std::map<std::string, std::string> environment = {}) {
    environment["LD_LIBRARY_PATH"] = tree->libraryFolder().string();
    environment["PKG_CONFIG_PATH"] = (tree->libraryFolder() / "pkgconfig").string();
    WatchedProcess process({.arguments = std::move(arguments), .environment = std::move(environment)});
    EXPECT_EQ(process.wait().code, 0) << process.output();
    return process.output();
  }
  static std::string shell(const std::string& command) { return run({"/bin/sh", "-ec", command}); }
  /// For programs that are linked with the library: the sanitizer's part must be linked too.
  static std::string sanitizerFlag() {
    const std::string sanitizer = TALLYD_SANITIZER_NAME;
    return sanitizer.empty() ? "" : " -fsanitize=" + sanitizer;
  }
  static std::vector<std::string> linesOf(const std::string& text) {
    std::vector<std::string> lines;
    std::istringstream stream(text);
    for (std::string line; std::getline(stream, line);) lines.push_back(line);
    return lines;
  }
  static std::string fileText(const fs::path& path) {
    std::ostringstream text;
    text << std::ifstream(path).rdbuf();
    return text.str();
  }
  static void write(const fs::path& path, const std::string& text) {
    fs::create_directories(path.parent_path());
    std::ofstream(path) << text;
  }

  static std::unique_ptr<InstalledTree> tree;
};

std::unique_ptr<InstalledTree> ClientLibraryTest::tree;

TEST_F(ClientLibraryTest, ItsNameCarriesItsVersion) {
  const auto dynamic = run({"/usr/bin/readelf", "-d", (tree->libraryFolder() / "libtally.so").string()});
  EXPECT_NE(dynamic.find("Library soname: [libtally.so.1]"), std::string::npos) << dynamic;
  EXPECT_EQ(fs::read_symlink(tree->libraryFolder() / "libtally.so"), "libtally.so.1");
  std::size_t archives = 0;
  for (const auto& entry : fs::recursive_directory_iterator(tree->prefix()))
    archives += entry.path().extension() == ".a" ? 1 : 0;
  EXPECT_EQ(archives, 0U);
}

TEST_F(ClientLibraryTest, ExportsThePublicSymbolsOnly) {
  const auto library = (tree->libraryFolder() / "libtally.so").string();
  const std::regex allowed(
      "^(TALLY_1|tally_[a-z_]+|tallyd::TallyConnection::.*|tallyd::tallyDefaultSocketPath.*|"
      "tallyd::platform::(Value|Array|Dictionary)::.*|tallyd::platform::leadingInteger.*)$");
  std::size_t functions = 0;
  for (const auto& line : linesOf(shell("nm -D --defined-only -C " + library))) {
    const auto symbol = std::regex_replace(line, std::regex("^[0-9a-f]* *[A-Za-z] |@@TALLY_1$"), "");
    EXPECT_TRUE(std::regex_match(symbol, allowed)) << symbol;
    functions += symbol.starts_with("tally_") ? 1 : 0;
  }
  EXPECT_GT(functions, 50U);
}

TEST_F(ClientLibraryTest, EveryFunctionOfTheHeadersIsExported) {
  const auto symbols = shell("nm -D --defined-only " + (tree->libraryFolder() / "libtally.so").string());
  std::size_t checked = 0;
  for (const std::string header : {"tally.h", "values.h"}) {
    const auto text = fileText(tree->prefix() / "include/tally" / header);
    const std::regex declaration(R"(\n[a-z][A-Za-z_0-9 *]*[ *](tally_[a-z_]+)\()");
    for (std::sregex_iterator match(text.begin(), text.end(), declaration), end; match != end;
         ++match, ++checked)
      EXPECT_NE(symbols.find(" " + (*match)[1].str() + "@@TALLY_1\n"), std::string::npos) << (*match)[1];
  }
  EXPECT_GT(checked, 50U);
}

TEST_F(ClientLibraryTest, ItsHeadersIncludeNothingForeign) {
  std::size_t headers = 0;
  for (const auto& entry : fs::directory_iterator(tree->prefix() / "include/tally")) {
    const auto text = fileText(entry.path());
    const std::regex include(R"(#include ([<"])([^>"]+)[>"])");
    for (std::sregex_iterator match(text.begin(), text.end(), include), end; match != end; ++match) {
      const std::string name = (*match)[2];
      if ((*match)[1] == "\"") {
        EXPECT_TRUE(fs::exists(tree->prefix() / "include" / name)) << entry.path() << ": " << name;
      } else {
        EXPECT_TRUE(std::regex_match(name, std::regex("[a-z_]+|std(int|def)\\.h")))
            << entry.path() << ": " << name;
      }
    }
    ++headers;
    if (entry.path().filename() == "tally.h" || entry.path().filename() == "values.h" ||
        entry.path().filename() == "PithAdaptor.h") {
      shell("cc -std=c99 -pedantic-errors -Wall -Wextra -Werror -fsyntax-only -x c -I" +
            (tree->prefix() / "include").string() + " -include " + entry.path().string() + " /dev/null");
    }
    shell("c++ -std=c++20 -Wall -Wextra -Wpedantic -Werror -fsyntax-only -x c++ -I" +
          (tree->prefix() / "include").string() + " -include " + entry.path().string() + " /dev/null");
  }
  EXPECT_EQ(headers, 9U);
}

TEST_F(ClientLibraryTest, TheStatedVersionsAgree) {
  const auto source = tree->scratch() / "version.c";
  write(source,
        "#include <tally/tally.h>\n#include <stdio.h>\n#include <string.h>\nint main(void) {\n"
        "  printf(\"%d.%d.%d %s\\n\", TALLY_VERSION_MAJOR, TALLY_VERSION_MINOR, TALLY_VERSION_PATCH,"
        " tally_version());\n  return 0;\n}\n");
  const auto program = (tree->scratch() / "version").string();
  shell("cc -std=c99 " + source.string() + " $(pkg-config --cflags --libs tally)" + sanitizerFlag() + " -o " +
        program);
  const auto packaged = shell("pkg-config --modversion tally");
  const auto version = packaged.substr(0, packaged.find('\n'));
  EXPECT_EQ(run({program}), version + " " + version + "\n");
  EXPECT_TRUE(fs::exists(tree->libraryFolder() / ("libtally.so." + version)));
}

TEST_F(ClientLibraryTest, ACOnlyProjectFindsThePackage) {
  const auto folder = tree->scratch() / "consumer";
  write(
      folder / "CMakeLists.txt",
      "cmake_minimum_required(VERSION 3.16)\nproject(consumer LANGUAGES C)\nfind_package(Tally 1 REQUIRED)\n"
      "add_executable(consumer main.c)\ntarget_link_libraries(consumer PRIVATE Tally::tally)\n");
  write(folder / "main.c",
        "#include <tally/tally.h>\n#include <stdio.h>\nint main(void) { return "
        "puts(tally_version()) < 0; }\n");
  run({TALLYD_CMAKE, "-S", folder.string(), "-B", (folder / "build").string(),
       "-DCMAKE_PREFIX_PATH=" + tree->prefix().string(), "-DCMAKE_EXE_LINKER_FLAGS=" + sanitizerFlag()});
  run({TALLYD_CMAKE, "--build", (folder / "build").string()});
  EXPECT_EQ(run({(folder / "build/consumer").string()}), "1.0.0\n");
}

/// The examples against the real daemon: each one's event arrives at the collector.
class ExamplesTest : public ClientLibraryTest {
 protected:
  ExamplesTest() {
    storebags.serve("playhall", storebagWithHTTPSPost(), "max-age=600");
    root.setPreferences("com.quillon.tally", {{"tally_storebag_url", storebags.baseURL()},
                                              {"httpsPostURL", collector.url("/events")}});
    daemon = std::make_unique<TestDaemon>(root);
  }

  /// An interpreter knows nothing of a sanitizer, which must come before everything else, nor does it give
  /// all its memory back.
  static std::map<std::string, std::string> preloads() {
    const std::string sanitizer = TALLYD_SANITIZER_NAME;
    if (sanitizer.empty()) return {};
    const auto runtime =
        shell(std::string("c++ -print-file-name=") + (sanitizer == "thread" ? "libtsan.so" : "libasan.so"));
    return {{"LD_PRELOAD", runtime.substr(0, runtime.find('\n'))}, {"ASAN_OPTIONS", "detect_leaks=0"}};
  }
  static std::string example(const std::string& path) { return TALLYD_SOURCE_DIR "/examples/" + path; }

  void expectReported(const std::vector<std::string>& command, const std::string& language,
                      std::size_t messages) {
    auto arguments = command;
    arguments.push_back(root.socket().string());
    const auto output = run(arguments, preloads());
    EXPECT_TRUE(output.ends_with("reported\n")) << output;
    constexpr std::size_t kStartAndStop = 2;  // Posts may overtake each other.
    ASSERT_TRUE(collector.waitForRequests(kStartAndStop + messages));
    std::size_t found = 0;
    for (const Dictionary& event : receivedEvents(collector)) {
      if (event.string("from") != language) continue;
      ++found;
      EXPECT_EQ(event.string("departed"), "1.500");
      EXPECT_EQ(event.integer("stops"), 2) << Value(event).description();
    }
    EXPECT_EQ(found, messages);
  }

  StorebagServer storebags;
  LoopbackServer collector;
  TestRoot root{storebags};
  std::unique_ptr<TestDaemon> daemon;
};

TEST_F(ExamplesTest, TheCAndCppExamplesBuildWithCMakeAndReport) {
  const auto build = (tree->scratch() / "examples").string();
  run({TALLYD_CMAKE, "-S", example(""), "-B", build, "-DCMAKE_PREFIX_PATH=" + tree->prefix().string(),
       "-DCMAKE_EXE_LINKER_FLAGS=" + sanitizerFlag()});
  run({TALLYD_CMAKE, "--build", build});
  expectReported({build + "/report-c"}, "C", 2);
}

TEST_F(ExamplesTest, TheCExampleBuildsWithPkgConfigAndReports) {
  const auto program = (tree->scratch() / "report-c").string();
  shell("cc -std=c99 -Wall -Wextra -Werror " + example("c/report.c") +
        " $(pkg-config --cflags --libs tally)" + sanitizerFlag() + " -o " + program);
  expectReported({program}, "C", 2);
}

TEST_F(ExamplesTest, TheCppExampleBuildsWithPkgConfigAndReports) {
  const auto program = (tree->scratch() / "report-cpp").string();
  shell("c++ -std=c++20 -Wall -Wextra -Werror " + example("cpp/report.cpp") +
        " $(pkg-config --cflags --libs tally)" + sanitizerFlag() + " -o " + program);
  expectReported({program}, "C++", 2);
}

TEST_F(ExamplesTest, ThePythonExampleReportsWithADBusLibraryAlone) {
  expectReported({"/usr/bin/python3", example("python/report_dbus.py")}, "Python", 1);
}

TEST_F(ExamplesTest, TheCtypesExampleReports) {
  expectReported({"/usr/bin/python3", example("python/report_ctypes.py")}, "ctypes", 1);
}

}  // namespace
}  // namespace tallyd::test
