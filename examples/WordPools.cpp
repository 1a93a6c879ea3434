// Counts the words of texts, as a first real host of the pools. Each text has a pool named after
// its file, in which every line and every distinct word is a block of its own: short ones become
// records of buckets, long ones heap records. All texts live together until they are reported, and
// then each is dropped with one Clear.

#include <MemPool>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstddef>
#include <cstring>
#include <deque>
#include <exception>
#include <filesystem>
#include <fstream>
#include <iomanip>
#include <iostream>
#include <stdexcept>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include <CLI/CLI.hpp>

namespace {

using OBR::MemPool::Mgr;

constexpr std::size_t maxBlock = 1073741823;  // Mgr::Alloc stops the process above this.

// Letters, digits, and all bytes above 127, so that words in UTF-8 stay whole. Not the process's
// locale: the same text gives the same words everywhere.
bool IsWordByte(unsigned char byte) {
    return (byte >= 'a' && byte <= 'z') || (byte >= 'A' && byte <= 'Z') ||
           (byte >= '0' && byte <= '9') || byte > 127;
}

char ToSmall(char letter) {
    return letter >= 'A' && letter <= 'Z' ? static_cast<char>(letter - 'A' + 'a') : letter;
}

class Text {
public:
    using WordCount = std::pair<std::string_view, std::size_t>;

    explicit Text(const std::string& name) : pool(name.c_str()) {}
    Text(const Text&) = delete;
    Text& operator=(const Text&) = delete;
    ~Text() { Drop(); }

    void Read(std::istream& input) {
        std::string line;
        while (std::getline(input, line)) {
            if (line.size() > maxBlock) {
                throw std::runtime_error("line " + std::to_string(numLines + 1) + " has " +
                                         std::to_string(line.size()) +
                                         " bytes, and a block at most " + std::to_string(maxBlock));
            }
            CountWords(Keep(line));
            ++numLines;
        }
        if (input.bad()) { throw std::runtime_error(std::strerror(errno)); }
    }

    // The `n` most frequent words, equally frequent ones in the order of their bytes.
    std::vector<WordCount> TopWords(std::size_t n) const {
        std::vector<WordCount> top(std::min(n, counts.size()));
        std::partial_sort_copy(counts.begin(), counts.end(), top.begin(), top.end(),
                               [](const WordCount& left, const WordCount& right) {
                                   if (left.second != right.second) {
                                       return left.second > right.second;
                                   }
                                   return left.first < right.first;
                               });
        return top;
    }

    // A disabled pool keeps no books: its Clear frees nothing, and each block goes back by itself.
    void Drop() {
        counts.clear();
        if (pool.IsEnabled()) {
            pool.Clear();
        } else {
            for (void* const block : blocks) { pool.Free(block); }
            blocks.clear();
        }
    }

    const Mgr& Pool() const { return pool; }
    std::size_t NumLines() const { return numLines; }
    std::size_t NumWords() const { return counts.size(); }
    std::size_t NumBlocks() const { return numBlocks; }
    std::size_t NumBytes() const { return numBytes; }

private:
    std::string_view Keep(std::string_view bytes) {
        void* const block = pool.Alloc(static_cast<unsigned int>(bytes.size()));
        if (!pool.IsEnabled()) { blocks.push_back(block); }
        ++numBlocks;
        numBytes += bytes.size();
        return {static_cast<char*>(std::memcpy(block, bytes.data(), bytes.size())), bytes.size()};
    }

    void CountWords(std::string_view line) {
        for (std::size_t at = 0; at < line.size(); ++at) {
            word.clear();
            for (; at < line.size() && IsWordByte(static_cast<unsigned char>(line[at])); ++at) {
                word.push_back(ToSmall(line[at]));
            }
            if (word.empty()) { continue; }
            const auto known = counts.find(word);
            if (known != counts.end()) {
                ++known->second;
            } else {
                counts.emplace(Keep(word), 1);
            }
        }
    }

    Mgr pool;
    std::unordered_map<std::string_view, std::size_t> counts;  // The words are blocks of the pool.
    std::vector<void*> blocks;                                 // Only for a disabled pool.
    std::string word;                                          // The word being read.
    std::size_t numLines = 0;
    std::size_t numBlocks = 0;
    std::size_t numBytes = 0;
};

// Pool names are unique: a second text of the same name gets a number.
std::string PoolName(const std::string& file) {
    const std::string base = file == "-" ? "(standard input)" : file;
    std::string name = base;
    for (int number = 2; OBR::MemPool::GetMgr(name.c_str()) != nullptr; ++number) {
        name = base + " #" + std::to_string(number);
    }
    return name;
}

void ReadFile(Text& text, const std::string& file) {
    if (file == "-") {
        text.Read(std::cin);
        return;
    }
    if (std::filesystem::is_directory(file)) { throw std::runtime_error("is a directory"); }
    std::ifstream input(file, std::ios::binary);
    if (!input) { throw std::runtime_error(std::strerror(errno)); }
    text.Read(input);
}

// Returns whether the file could be read. One that could not leaves no text.
bool AddText(std::deque<Text>& texts, const std::string& file) {
    Text& text = texts.emplace_back(PoolName(file));
    try {
        ReadFile(text, file);
        return true;
    } catch (const std::exception& error) {
        texts.pop_back();
        std::cerr << "WordPools: " << file << ": " << error.what() << std::endl;
        return false;
    }
}

void PrintWords(const Text& text, std::size_t top) {
    std::cout << text.Pool().GetName() << ": " << text.NumLines() << " lines, " << text.NumWords()
              << " distinct words\n";
    for (const auto& [word, count] : text.TopWords(top)) {
        std::cout << std::setw(10) << count << "  " << word << '\n';
    }
    std::cout << '\n';
}

// One line a pool, in the order of the names, from the library's own list of pools.
void PrintPools(const std::deque<Text>& texts) {
    std::vector<Mgr*> mgrs;
    OBR::MemPool::GetMgrs(mgrs);
    for (const Mgr* const mgr : mgrs) {
        const auto text = std::find_if(texts.begin(), texts.end(), [mgr](const Text& candidate) {
            return &candidate.Pool() == mgr;
        });
        std::cout << "pool " << mgr->GetName() << ": " << text->NumBlocks() << " blocks, "
                  << text->NumBytes() << " bytes asked for, "
                  << (mgr->IsEnabled() ? "enabled" : "disabled") << '\n';
    }
    std::cout << '\n';
}

template <typename Work>
double Seconds(Work work) {
    const auto start = std::chrono::steady_clock::now();
    work();
    return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

int Run(int argc, char** argv) {
    CLI::App app{
        "Counts the words of texts, with every line and distinct word in a pool named after its "
        "file.\nA word is a run of letters, digits and bytes above 127; capitals count as small "
        "letters."};
    std::vector<std::string> files;
    std::size_t top = 10;
    bool heap = false;
    bool detailed = false;
    app.add_option("FILE", files, "Texts to read; - is the standard input")->required();
    app.add_option("--top", top, "How many of the most frequent words to print")
        ->check(CLI::Range(0, 1000000))
        ->capture_default_str();
    app.add_flag("--heap", heap, "Turn the pools off: every block comes from the heap");
    app.add_flag("--detailed", detailed, "Report every bucket and every record of the pools");
    CLI11_PARSE(app, argc, argv);

    OBR::MemPool::NUV_OBR_MEMPOOL_ON(!heap);
    std::ios::sync_with_stdio(false);

    std::deque<Text> texts;  // A deque: a handle stays at its address.
    bool allRead = true;
    const double keeping = Seconds([&] {
        for (const std::string& file : files) { allRead = AddText(texts, file) && allRead; }
    });

    for (const Text& text : texts) { PrintWords(text, top); }
    PrintPools(texts);
    if (detailed) {
        OBR::MemPool::DbgDetailed();
    } else {
        OBR::MemPool::Dbg();
    }

    const double dropping = Seconds([&] {
        for (Text& text : texts) { text.Drop(); }
    });
    std::cout << std::fixed << std::setprecision(3) << "pools " << (heap ? "off" : "on") << ": "
              << keeping << " s to read and keep, " << dropping << " s to drop, "
              << keeping + dropping << " s elapsed" << std::endl;
    if (!std::cout) { std::cerr << "WordPools: cannot write the output" << std::endl; }
    return allRead && std::cout ? 0 : 1;
}

}  // namespace

int main(int argc, char** argv) {
    try {
        return Run(argc, argv);
    } catch (const std::exception& error) {
        std::cerr << "WordPools: " << error.what() << std::endl;
        return 1;
    }
}
