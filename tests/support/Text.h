#ifndef TAV_IPMI_TESTS_TEXT_H
#define TAV_IPMI_TESTS_TEXT_H

// Reading what other programs print: shared by the tests and by the guest
// checker, which links nothing of the tests' own.

#include <ctype.h>

#include <fstream>
#include <map>
#include <sstream>
#include <string>
#include <vector>

namespace TestSupport {

inline std::string readFile(const std::string& path) {
    std::ifstream in(path);
    std::stringstream s;
    s << in.rdbuf();
    return s.str();
}

inline std::string trim(const std::string& s) {
    const size_t b = s.find_first_not_of(" \t\r\n");
    return b == std::string::npos ? std::string() : s.substr(b, s.find_last_not_of(" \t\r\n") - b + 1);
}

inline std::string lower(std::string s) {
    for (char& c : s) c = static_cast<char>(tolower(static_cast<unsigned char>(c)));
    return s;
}

inline std::vector<std::string> lines(const std::string& text) {
    std::vector<std::string> out;
    std::stringstream in(text);
    for (std::string line; std::getline(in, line);) out.push_back(line);
    return out;
}

// Splits at `sep`; the last field takes the rest once `maxFields` are reached.
inline std::vector<std::string> split(const std::string& s, char sep, size_t maxFields = static_cast<size_t>(-1)) {
    std::vector<std::string> out;
    size_t start = 0;
    for (size_t at; out.size() + 1 < maxFields && (at = s.find(sep, start)) != std::string::npos; start = at + 1)
        out.push_back(s.substr(start, at - start));
    out.push_back(s.substr(start));
    return out;
}

// "Name : value" lines, names and values trimmed; the first of each name.
inline std::map<std::string, std::string> fields(const std::string& text) {
    std::map<std::string, std::string> out;
    for (const auto& line : lines(text)) {
        const size_t colon = line.find(" : ");
        if (colon == std::string::npos) continue;
        const std::string name = trim(line.substr(0, colon));
        if (!name.empty()) out.emplace(name, trim(line.substr(colon + 3)));
    }
    return out;
}

}  // namespace TestSupport

#endif
