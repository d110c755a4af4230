// page-picture: what a page looks like, as a PNG.

#include <CLI/CLI.hpp>
#include <cstdio>
#include <exception>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <string>

#include "support/HeadlessBrowser.h"

namespace {

using tallyd::test::HeadlessBrowser;

struct Options {
  std::string url;
  std::filesystem::path file;
  HeadlessBrowser::Viewport viewport;
  bool phone = false;
  bool dark = false;
  std::string condition = "true";
};

void takePicture(Options options) {
  HeadlessBrowser browser;
  if (options.phone) options.viewport.device = HeadlessBrowser::Device::Phone;
  browser.setViewport(options.viewport);
  if (options.dark) browser.setColorScheme(HeadlessBrowser::ColorScheme::Dark);
  browser.open(options.url);
  if (!browser.waitUntil(options.condition)) throw std::runtime_error("never: " + options.condition);
  std::ofstream(options.file, std::ios::binary) << browser.screenshot();
  for (const std::string& problem : browser.problems()) std::fprintf(stderr, "%s\n", problem.c_str());
}

}  // namespace

int main(int argc, char** argv) {
  try {
    Options options;
    CLI::App app("Writes a picture of a page on this machine.");
    app.add_option("url", options.url, "The page")->required();
    app.add_option("file", options.file, "The picture, a PNG")->required();
    app.add_option("--width", options.viewport.width, "In CSS pixels")->capture_default_str();
    app.add_option("--height", options.viewport.height, "In CSS pixels")->capture_default_str();
    app.add_flag("--phone", options.phone, "As a phone shows it");
    app.add_flag("--dark", options.dark, "In dark colours");
    app.add_option("--when", options.condition, "Once this JavaScript expression is true");
    CLI11_PARSE(app, argc, argv);
    takePicture(options);
    return 0;
  } catch (const std::exception& exception) {
    std::fprintf(stderr, "page-picture: %s\n", exception.what());
    return 1;
  }
}
