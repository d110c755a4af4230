// A root folder whose settings files the tests write.
#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <string>

#include "fakes/FakeLog.h"
#include "fakes/TemporaryFolder.h"
#include "platform/Root.h"
#include "platform/property-list/PropertyList.h"

namespace tallyd::platform {

class SettingsFolder : public ::testing::Test {
 protected:
  [[nodiscard]] std::filesystem::path path(std::string_view relative) const {
    return _folder.path() / relative;
  }

  void write(std::string_view relative, std::string_view bytes) const {
    std::filesystem::create_directories(path(relative).parent_path());
    std::ofstream(path(relative), std::ios::binary) << bytes;
  }
  void writeList(std::string_view relative, const Value& value,
                 PropertyListFormat format = PropertyListFormat::XML) const {
    write(relative, dataWithPropertyList(value, format).value());
  }
  /// Sets the time of the last change of the contents.
  void setModified(std::string_view relative, time_t seconds, long nanoseconds) const {
    const timespec times[2] = {{seconds, nanoseconds}, {seconds, nanoseconds}};
    ASSERT_EQ(::utimensat(AT_FDCWD, path(relative).c_str(), times, 0), 0);
  }
  [[nodiscard]] std::string read(std::string_view relative) const {
    std::ifstream file(path(relative), std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
  }

  fakes::TemporaryFolder _folder;
  Root _root{_folder.path()};
  fakes::FakeLog _log;
};

}  // namespace tallyd::platform
