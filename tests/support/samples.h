#pragma once
// Whole-file byte helpers and access to the shared sample files.

#include <gtest/gtest.h>

#include "temp_folder.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

inline std::string ReadBytes(const std::filesystem::path& file) {
    std::ifstream in(file, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
}

inline void WriteBytes(const std::filesystem::path& file, const std::string& bytes) {
    std::ofstream(file, std::ios::binary | std::ios::trunc) << bytes;
}

// A file of the shared samples ($SKYVANE_SHARED_DIR/samples, else
// $SKYVANE_SOURCE_DIR/../shared/samples); fails the test clearly when missing.
inline std::filesystem::path SamplePath(const std::string& name) {
    const char* shared = std::getenv("SKYVANE_SHARED_DIR");
    const char* top = std::getenv("SKYVANE_SOURCE_DIR");
    const std::filesystem::path dir = shared && *shared ? std::filesystem::path(shared)
                                                        : std::filesystem::path(top ? top : ".") / ".." / "shared";
    const std::filesystem::path path = dir / "samples" / name;
    if (!std::filesystem::exists(path)) ADD_FAILURE() << "sample file missing: " << path << " (set SKYVANE_SOURCE_DIR)";
    return path;
}
