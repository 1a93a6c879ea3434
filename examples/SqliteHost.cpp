// Runs an SQL file in SQLite, with all of SQLite's memory in a heap: sqlite3_config takes the
// functions. With --heap SQLite uses the C library's malloc, for comparison.
//
// Prints rows as the sqlite3 program does: a line per row, with "|" between values. The first error
// ends the run.

#include <MemPoolHeap>

#include <sys/resource.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <exception>
#include <fstream>
#include <iostream>
#include <iterator>
#include <memory>
#include <string>

#include <sqlite3.h>

#include "CommandLine.hpp"

namespace {

using OBR::MemPool::Heap;
using OBR::MemPool::HeapSettings;

// SQLite has two kinds of blocks. The small ones of the parser and of prepared statements live as
// long as a statement, so size classes often become empty, and empty buckets are kept. The pages of
// the page cache, some 4360 bytes each, live long; as heap records they waste less memory than in
// buckets. Few blocks live at a time, so larger buckets would not help.
HeapSettings Settings(bool on) {
    return HeapSettings().On(on).BucketSize(4010).MaxRecordSize(1000).KeepEmptyBuckets(true);
}

// SQLite passes no context to these functions, so the process has one heap.
Heap* memory = nullptr;

sqlite3_mem_methods Methods() {
    sqlite3_mem_methods methods{};
    methods.xMalloc = [](int size) { return memory->Malloc(static_cast<std::size_t>(size)); };
    methods.xFree = [](void* block) { memory->Free(block); };
    methods.xRealloc = [](void* block, int size) {
        return memory->Realloc(block, static_cast<std::size_t>(size));
    };
    methods.xSize = [](void* block) { return static_cast<int>(memory->UsableSize(block)); };
    methods.xRoundup = [](int size) { return (size + 7) & ~7; };
    methods.xInit = [](void*) { return SQLITE_OK; };
    methods.xShutdown = [](void*) {};
    return methods;
}

struct Options {
    std::string database = ":memory:";
    std::string file;
    bool useMalloc = false;
    bool off = false;
    bool report = false;
};

bool Fail(sqlite3* database, const std::string& file, const std::string& sql,
          const char* position) {
    const char* const text = database != nullptr ? sqlite3_errmsg(database) : "out of memory";
    auto line = 1 + std::count(sql.data(), position, '\n');
    for (; *position == '\n' || *position == ' '; ++position) { line += *position == '\n'; }
    std::cerr << "SqliteHost: " << file << ":" << line << ": " << text << "\n";
    return false;
}

void PrintRow(sqlite3_stmt* statement) {
    for (int column = 0; column < sqlite3_column_count(statement); ++column) {
        const auto* const text = sqlite3_column_text(statement, column);
        if (column > 0) { std::fputc('|', stdout); }
        if (text != nullptr) { std::fputs(reinterpret_cast<const char*>(text), stdout); }
    }
    std::fputc('\n', stdout);
}

bool RunSql(sqlite3* database, const std::string& file, const std::string& sql) {
    for (const char* position = sql.c_str(); *position != '\0';) {
        sqlite3_stmt* statement = nullptr;
        const char* rest = nullptr;
        if (sqlite3_prepare_v2(database, position, -1, &statement, &rest) != SQLITE_OK) {
            return Fail(database, file, sql, position);
        }
        while (sqlite3_step(statement) == SQLITE_ROW) { PrintRow(statement); }
        // Repeats an error of sqlite3_step. Accepts a null statement.
        if (sqlite3_finalize(statement) != SQLITE_OK) {
            return Fail(database, file, sql, position);
        }
        position = rest;
    }
    return true;
}

double Seconds() {
    const auto now = std::chrono::steady_clock::now().time_since_epoch();
    return std::chrono::duration<double>(now).count();
}

bool Run(const Options& options) {
    std::ifstream input(options.file);
    const std::string sql(std::istreambuf_iterator<char>(input), {});
    if (!input) {
        std::cerr << "SqliteHost: cannot read " << options.file << "\n";
        return false;
    }

    const double begin = Seconds();
    sqlite3* database = nullptr;
    bool success = sqlite3_open(options.database.c_str(), &database) == SQLITE_OK
                       ? RunSql(database, options.file, sql)
                       : Fail(database, options.database, sql, sql.c_str());
    if (options.report && memory != nullptr) {
        std::fflush(stdout);
        memory->GetMgr().Dbg();
    }
    sqlite3_close(database);
    const double run = Seconds() - begin;

    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    std::fprintf(stderr, "%s: run %.3f s, peak %.1f MB\n", options.file.c_str(), run,
                 static_cast<double>(usage.ru_maxrss) / 1000);
    return success;
}

int Main(int argc, char** argv) {
    Options options;
    CommandLine line("SqliteHost", "Runs an SQL file with SQLite's memory in a pool.");
    line.File("FILE", options.file, "SQL statements");
    line.Text("--database", options.database, "Database file");
    line.Flag("--heap", options.useMalloc, "Use the C library's malloc instead of pools");
    line.Flag("--off", options.off, "Disable pools, so that a memory checker sees each block");
    line.Flag("--report", options.report, "Print the pool at the end");
    int status = 0;
    if (!line.Read(argc, argv, status)) { return status; }

    std::unique_ptr<Heap> heap;
    sqlite3_config(SQLITE_CONFIG_MEMSTATUS, 0);  // SQLite then keeps no statistics of its own.
    if (!options.useMalloc) {
        heap = std::make_unique<Heap>("sqlite", Settings(!options.off));
        memory = heap.get();
        const sqlite3_mem_methods methods = Methods();
        sqlite3_config(SQLITE_CONFIG_MALLOC, &methods);
    }
    const bool success = Run(options);
    sqlite3_shutdown();
    return success ? 0 : 1;
}

}  // namespace

int main(int argc, char** argv) {
    try {
        return Main(argc, argv);
    } catch (const std::exception& error) {
        std::fprintf(stderr, "SqliteHost: %s\n", error.what());
        return 1;
    }
}
