// Traces written in a shorthand, and read from memory in pieces of a few bytes.

#ifndef OBR_TESTS_TRACELINES_HPP
#define OBR_TESTS_TRACELINES_HPP

#include <algorithm>
#include <cstddef>
#include <map>
#include <memory>
#include <string>
#include <utility>

#include "trace/Input.hpp"
#include "trace/StepReader.hpp"
#include "trace/TextReader.hpp"

// The lines that the shorthand stands for: the pools are P and Q, the addresses of blocks X and Y.
inline std::string Lines(const std::string& shorthand) {
    const std::map<char, const char*> meanings = {{'@', "xmpt:"},
                                                  {'P', "00000000006a1200"},
                                                  {'Q', "00000000006a1300"},
                                                  {'X', "00007f0000000010"},
                                                  {'Y', "00007f0000000020"}};
    std::string text;
    for (const char letter : shorthand) {
        const auto meaning = meanings.find(letter);
        text += meaning != meanings.end() ? meaning->second : std::string(1, letter);
    }
    return text;
}

class TextSource final : public Trace::ByteSource {
public:
    explicit TextSource(std::string text) : whole(std::move(text)) {}
    std::size_t Read(char* bytes, std::size_t size) override {
        const std::size_t number = whole.copy(bytes, std::min<std::size_t>(size, 7), numRead);
        numRead += number;
        return number;
    }
    std::string Problem() const override { return ""; }

private:
    std::string whole;
    std::size_t numRead = 0;
};

inline std::unique_ptr<Trace::TextReader> ReadLines(const std::string& lines) {
    return std::make_unique<Trace::TextReader>(Trace::Input(std::make_unique<TextSource>(lines)));
}

#endif
