#pragma once
// Shared by the fuzz targets: a failed invariant aborts, so that libFuzzer
// keeps the input and the replay test fails; a reader that takes bytes off
// the front of the input and gives zeros once it runs dry.

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string_view>

inline void FuzzCheck(bool condition, const char* what) {
    if (!condition) {
        std::fprintf(stderr, "fuzz invariant broken: %s\n", what);
        std::abort();
    }
}

class FuzzBytes {
public:
    FuzzBytes(const std::uint8_t* data, std::size_t size) : m_data(data), m_size(size) {}

    std::uint8_t Byte() { return m_pos < m_size ? m_data[m_pos++] : 0; }
    bool Flag() { return Byte() & 1; }
    template <typename T>
    T Plain() {
        unsigned char raw[sizeof(T)] = {};
        for (unsigned char& b : raw) b = Byte();
        T value;
        std::memcpy(&value, raw, sizeof value);
        return value;
    }
    // Up to max bytes as text (the length comes first).
    std::string_view Text(std::size_t max) {
        const std::size_t wanted = Byte() % (max + 1);  // read before what is left is counted
        return Take(std::min(wanted, m_size - m_pos));
    }
    std::string_view Rest() { return Take(m_size - m_pos); }

private:
    std::string_view Take(std::size_t n) {
        const std::string_view taken(reinterpret_cast<const char*>(m_data) + m_pos, n);
        m_pos += n;
        return taken;
    }

    const std::uint8_t* m_data;
    std::size_t m_size;
    std::size_t m_pos = 0;
};
