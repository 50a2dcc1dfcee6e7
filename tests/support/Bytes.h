// Bytes as tests write and read them: packets spelt out byte by byte, and
// whole files.
#pragma once

#include <fstream>
#include <initializer_list>
#include <sstream>
#include <string>

inline std::string Bytes(std::initializer_list<int> bytes) {
    std::string s;
    for (int b : bytes) s.push_back(static_cast<char>(b));
    return s;
}

// The file's bytes ("" when it cannot be read).
inline std::string ReadFile(const std::string &path) {
    std::stringstream ss;
    ss << std::ifstream(path, std::ios::binary).rdbuf();
    return ss.str();
}
