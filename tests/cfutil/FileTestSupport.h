// Test helpers for the file utilities: a temporary directory removed after each test, files
// written into it, file URLs, and environment variables restored afterwards.
#pragma once

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>

#include <gtest/gtest.h>

#include "platform/PropertyValues.h"
#include "support/ScopedEnvironment.h"
#include "support/Values.h"

namespace glyphwell::testing {

/// A new URL of the absolute path `path` (a directory URL when `isDirectory`).
inline CFURLRef NewFileURL(const std::string& path, bool isDirectory = false) {
    return CFURLCreateFromFileSystemRepresentation(
        nullptr, reinterpret_cast<const UInt8*>(path.data()), CFIndex(path.size()), isDirectory);
}

/// A readable text of a property value: strings and URLs as their text, booleans as "true" or
/// "false", numbers as a decimal integer, dates as their absolute time, "<null>" for null.
inline std::string ValueText(CFTypeRef value) {
    if (value && CFGetTypeID(value) == CFBooleanGetTypeID())
        return value == kCFBooleanTrue ? "true" : "false";
    if (value && CFGetTypeID(value) == CFNumberGetTypeID()) {
        SInt64 number = 0;
        CFNumberGetValue(static_cast<CFNumberRef>(value), kCFNumberSInt64Type, &number);
        return std::to_string(number);
    }
    if (value && CFGetTypeID(value) == CFDateGetTypeID())
        return std::to_string(CFDateGetAbsoluteTime(static_cast<CFDateRef>(value)));
    return TextOf(value);
}

/// A fresh directory under the system's temporary directory for each test (mkdtemp), and the
/// environment variables a test changed put back as they were.
class TemporaryDirectoryTest : public ::testing::Test {
protected:
    void SetUp() override {
        std::string pattern =
            (std::filesystem::temp_directory_path() / "glyphwell-XXXXXX").string();
        ASSERT_NE(mkdtemp(pattern.data()), nullptr);
        // The resolved form, so that expectations hold when the temporary directory is a link.
        directory_ = std::filesystem::canonical(pattern).string();
    }
    void TearDown() override {
        std::error_code ignored;
        std::filesystem::remove_all(directory_, ignored);
    }

    /// The path of `name` inside the temporary directory.
    std::string PathOf(const std::string& name) const { return directory_ + "/" + name; }

    /// Writes `contents` to `name` inside the temporary directory; returns its path.
    std::string WriteFile(const std::string& name, const std::string& contents) {
        std::string path = PathOf(name);
        std::filesystem::create_directories(std::filesystem::path(path).parent_path());
        std::ofstream(path, std::ios::binary) << contents;
        return path;
    }

    std::string directory_;
    ScopedEnvironment environment_; ///< variables a test sets, put back after it
};

} // namespace glyphwell::testing
