// Counts the words of texts. Each text has a pool, named after its file, in which every line and
// every distinct word is a block: a record of a bucket, or a heap record if it is long. After all
// texts have been reported, each is dropped: with one Clear, or block by block if pools are off.
// The last line of the output has the times and the memory that this took.

#include <MemPool>

#include <sys/resource.h>

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <deque>
#include <exception>
#include <fstream>
#include <iomanip>
#include <iostream>
#include <new>
#include <stdexcept>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include "CommandLine.hpp"
#include "Progress.hpp"

namespace {

using OBR::MemPool::Mgr;

constexpr std::size_t maxBlock = 1073741823;  // Mgr::Alloc stops the process above this.

// Letters, digits, and all bytes above 127, so that words in UTF-8 stay whole. Ignores the locale,
// so that a text has the same words everywhere.
bool IsWordByte(unsigned char byte) {
    return (byte >= 'a' && byte <= 'z') || (byte >= 'A' && byte <= 'Z') ||
           (byte >= '0' && byte <= '9') || byte > 127;
}

char ToSmall(char letter) {
    return letter >= 'A' && letter <= 'Z' ? static_cast<char>(letter - 'A' + 'a') : letter;
}

// A text in memory: its lines, and how often each word occurs.
class Text {
public:
    using WordCount = std::pair<std::string_view, std::size_t>;

    explicit Text(const std::string& name) : pool(name.c_str()) {}
    Text(const Text&) = delete;
    Text& operator=(const Text&) = delete;
    ~Text() { Drop(); }

    void Read(std::istream& input, Progress& progress) {
        std::string line;
        while (std::getline(input, line)) {
            if (line.size() > maxBlock) {
                throw std::runtime_error("line " + std::to_string(lines.size() + 1) + " has " +
                                         std::to_string(line.size()) +
                                         " bytes, and a block at most " + std::to_string(maxBlock));
            }
            lines.push_back(Keep(line));
            CountWords(lines.back());
            progress.Add(line.size() + 1);
        }
        if (input.bad()) { throw std::runtime_error(std::strerror(errno)); }
    }

    // The `n` most frequent words; equally frequent ones are sorted by their bytes.
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

    // The Clear of a disabled pool frees nothing, so each block must be freed.
    void Drop() {
        if (pool.IsEnabled()) {
            pool.Clear();
        } else {
            for (const std::string_view line : lines) { Free(line); }
            for (const auto& [kept, count] : counts) { Free(kept); }
        }
        counts.clear();
        lines.clear();
    }

    const Mgr& Pool() const { return pool; }
    std::size_t NumLines() const { return lines.size(); }
    std::size_t NumWords() const { return counts.size(); }
    std::size_t NumBlocks() const { return NumLines() + NumWords(); }
    std::size_t NumBytes() const { return numBytes; }

private:
    std::string_view Keep(std::string_view bytes) {
        void* const block = pool.Alloc(static_cast<unsigned int>(bytes.size()));
        numBytes += bytes.size();
        return {static_cast<char*>(std::memcpy(block, bytes.data(), bytes.size())), bytes.size()};
    }

    void Free(std::string_view kept) { pool.Free(const_cast<char*>(kept.data())); }

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
    std::deque<std::string_view> lines;  // The bytes of lines and words are blocks of the pool.
    std::unordered_map<std::string_view, std::size_t> counts;
    std::string word;  // The word being read.
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

void ReadFile(Text& text, const std::string& file, Progress& progress) {
    if (file == "-") {
        text.Read(std::cin, progress);
        return;
    }
    std::ifstream input(file, std::ios::binary);
    if (!input) { throw std::runtime_error(std::strerror(errno)); }
    text.Read(input, progress);
}

// Returns whether the file could be read. Otherwise no text is added.
bool AddText(std::deque<Text>& texts, const std::string& file, Progress& progress) {
    const auto refuse = [&, numBefore = texts.size()](const char* reason) {
        if (texts.size() > numBefore) { texts.pop_back(); }
        progress.Clear();
        std::cerr << "WordPools: " << file << ": " << reason << std::endl;
        return false;
    };
    try {
        ReadFile(texts.emplace_back(PoolName(file)), file, progress);
        return true;
    } catch (const std::bad_alloc&) {
        return refuse(std::strerror(ENOMEM));
    } catch (const std::exception& error) { return refuse(error.what()); }
}

void PrintWords(const Text& text, std::size_t top) {
    std::cout << text.Pool().GetName() << ": " << text.NumLines() << " lines, " << text.NumWords()
              << " distinct words\n";
    for (const auto& [word, count] : text.TopWords(top)) {
        std::cout << std::setw(10) << count << "  " << word << '\n';
    }
    std::cout << '\n';
}

// Prints a line per pool, sorted by name, from the library's list of pools.
void PrintPools(const std::deque<Text>& texts) {
    std::vector<Mgr*> mgrs;
    OBR::MemPool::GetMgrs(mgrs);
    for (const Mgr* const mgr : mgrs) {
        const auto text = std::find_if(texts.begin(), texts.end(), [mgr](const Text& candidate) {
            return &candidate.Pool() == mgr;
        });
        std::cout << "pool " << mgr->GetName() << ": " << text->NumBlocks() << " blocks, "
                  << text->NumBytes() << " bytes requested, "
                  << (mgr->IsEnabled() ? "enabled" : "disabled") << '\n';
    }
    std::cout << '\n';
}

// Processor time, which other processes and slow input do not affect.
template <typename Work>
double Seconds(Work work) {
    const std::clock_t start = std::clock();
    work();
    return static_cast<double>(std::clock() - start) / CLOCKS_PER_SEC;
}

// The peak resident memory of this process in KiB.
long PeakResident() {
    rusage usage = {};
    getrusage(RUSAGE_SELF, &usage);
    return usage.ru_maxrss;
}

struct Options {
    std::vector<std::string> files;
    int top = 10;
    bool heap = false;
    bool report = false;
    bool detailed = false;
    bool figures = false;
};

void PrintTexts(const std::deque<Text>& texts, const Options& options) {
    for (const Text& text : texts) { PrintWords(text, static_cast<std::size_t>(options.top)); }
    PrintPools(texts);
    if (options.detailed) {
        OBR::MemPool::DbgDetailed();
    } else if (options.report) {
        OBR::MemPool::Dbg();
    }
}

// Returns whether all files could be read and the output written.
bool CountAll(const Options& options) {
    OBR::MemPool::NUV_OBR_MEMPOOL_ON(!options.heap);
    std::deque<Text> texts;  // A deque: a handle stays at its address.
    bool allRead = true;
    Progress progress;
    const double reading = Seconds([&] {
        for (const std::string& file : options.files) {
            allRead = AddText(texts, file, progress) && allRead;
        }
    });
    progress.Clear();

    if (!options.figures) { PrintTexts(texts, options); }
    const double dropping = Seconds([&] {
        for (Text& text : texts) { text.Drop(); }
    });
    std::cout << std::fixed;
    if (options.figures) {
        std::cout << std::setprecision(6) << reading << ' ' << dropping << ' ' << PeakResident();
    } else {
        std::cout << std::setprecision(3) << "pools " << (options.heap ? "off" : "on") << ": "
                  << reading << " s to read and keep, " << dropping << " s to drop, "
                  << PeakResident() << " KiB resident at the peak";
    }
    std::cout << std::endl;
    if (!std::cout) { std::cerr << "WordPools: cannot write the output" << std::endl; }
    return allRead && std::cout;
}

constexpr const char* description =
    R"(Counts the words of texts, with every line and distinct word in a pool named after its file.
A word is a run of letters, digits and bytes above 127. Upper and lower case count as the same.

The last line of the output has the processor time to read and to drop the texts, and the peak of
resident memory.

A text that cannot be read is reported on standard error and left out. The exit status is then 1.)";

int Run(int argc, char** argv) {
    Options options;
    CommandLine line("WordPools", description);
    line.Files("FILE", options.files, "Texts to read; - is the standard input");
    line.Number("--top", options.top, 0, 1000000, "Print the N most frequent words");
    line.Flag("--heap", options.heap, "Disable pools, so that every block comes from the heap");
    line.Flag("--report", options.report, "Print the report of each pool");
    line.Flag("--detailed", options.detailed,
              "Print the detailed report of each pool, with every record");
    line.Flag("--figures", options.figures,
              "Print only seconds to read, seconds to drop, and KiB at the peak");
    line.Exclude("--figures", {"--top", "--report", "--detailed"});
    int status = 0;
    if (!line.Read(argc, argv, status)) { return status; }
    std::ios::sync_with_stdio(false);
    return CountAll(options) ? EXIT_SUCCESS : EXIT_FAILURE;
}

}  // namespace

int main(int argc, char** argv) {
    try {
        return Run(argc, argv);
    } catch (const std::exception& error) {
        std::cerr << "WordPools: " << error.what() << std::endl;
        return EXIT_FAILURE;
    }
}
