// The front end of a small compiler. It parses arithmetic with variables and functions into a tree,
// evaluates the tree, and drops it with one call. Each unit, here a generated text of many
// definitions, has a heap of its own. The nodes come from it through an Allocator, the names and
// argument lists in the nodes through a Resource.
//
// With --heap the same tree uses new and delete, and is dropped node by node.
//
//     let v7 = max(v3, 2 * 1.5) + (v1 - 8) / 4;

#include <MemPoolHeap>

#include <algorithm>
#include <cctype>
#include <charconv>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <exception>
#include <memory>
#include <memory_resource>
#include <stdexcept>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "CommandLine.hpp"

namespace {

using OBR::MemPool::Allocator;
using OBR::MemPool::Heap;
using OBR::MemPool::HeapSettings;
using OBR::MemPool::Resource;

enum class Kind : std::uint8_t { Number, Variable, Sum, Difference, Product, Quotient, Call };

struct Node {
    Node(Kind ofKind, std::pmr::memory_resource& memory)
        : kind(ofKind), name(&memory), args(&memory) {}

    Kind kind;
    double value = 0;              // Of a number.
    std::pmr::string name;         // Of a variable or a function.
    std::pmr::vector<Node*> args;  // The operands.
};

// The tree of a unit on pools. A compiler frees almost nothing before it drops the tree, so large
// buckets are filled completely, and few are needed. No bucket becomes empty before the drop, so
// keeping empty ones would not help.
class PoolMemory {
public:
    explicit PoolMemory(bool on)
        : heap("unit", HeapSettings().On(on).BucketSize(65535)), nodes(heap), resource(heap) {}

    template <typename... Args>
    Node* Make(Args... args) {
        return ::new (nodes.allocate(1)) Node(args..., resource);
    }
    std::pmr::memory_resource& Texts() { return resource; }

    // Everything that the nodes own is in the heap too, so no destructor has to run.
    void Drop(const std::vector<Node*>&) { heap.FreeAll(); }

    void Report() const { heap.GetMgr().Dbg(); }

private:
    Heap heap;
    Allocator<Node> nodes;
    Resource resource;
};

// The same tree with new and delete.
class PlainMemory {
public:
    template <typename... Args>
    Node* Make(Args... args) {
        return new Node(args..., Texts());
    }
    std::pmr::memory_resource& Texts() { return *std::pmr::new_delete_resource(); }
    void Drop(const std::vector<Node*>& roots) {
        for (const Node* root : roots) { Delete(root); }
    }
    void Report() const {}

private:
    static void Delete(const Node* node) {
        for (const Node* arg : node->args) { Delete(arg); }
        delete node;
    }
};

// A recursive-descent parser. A syntax error is a std::runtime_error with its position.
template <typename Memory>
class Parser {
public:
    Parser(std::string_view source, Memory& memoryOfNodes) : text(source), memory(memoryOfNodes) {}

    // Every `let` of the text: its name and its tree.
    void ParseAll(std::vector<Node*>& roots, std::vector<std::string_view>& names) {
        for (SkipBlanks(); place < text.size(); SkipBlanks()) {
            if (Word() != "let") { Fail("'let' expected"); }
            names.push_back(Word());
            Expect('=');
            roots.push_back(Sum());
            Expect(';');
        }
    }

private:
    Node* Sum() {
        Node* left = Product();
        while (Peek() == '+' || Peek() == '-') {
            const Kind kind = text[place++] == '+' ? Kind::Sum : Kind::Difference;
            left = Binary(kind, left, Product());
        }
        return left;
    }

    Node* Product() {
        Node* left = Operand();
        while (Peek() == '*' || Peek() == '/') {
            const Kind kind = text[place++] == '*' ? Kind::Product : Kind::Quotient;
            left = Binary(kind, left, Operand());
        }
        return left;
    }

    Node* Operand() {
        const char next = Peek();
        if (next == '(') {
            ++place;
            Node* const inner = Sum();
            Expect(')');
            return inner;
        }
        if (std::isdigit(static_cast<unsigned char>(next)) != 0) {
            Node* const number = memory.Make(Kind::Number);
            const char* const end = text.data() + text.size();
            const char* const rest = std::from_chars(text.data() + place, end, number->value).ptr;
            place = static_cast<std::size_t>(rest - text.data());
            return number;
        }
        Node* const node = memory.Make(Kind::Variable);
        node->name = Word();
        if (Peek() != '(') { return node; }
        node->kind = Kind::Call;
        do {
            ++place;
            node->args.push_back(Sum());
        } while (Peek() == ',');
        Expect(')');
        return node;
    }

    Node* Binary(Kind kind, Node* left, Node* right) {
        Node* const node = memory.Make(kind);
        node->args = {left, right};
        return node;
    }

    std::string_view Word() {
        SkipBlanks();
        const std::size_t begin = place;
        while (place < text.size() && std::isalnum(static_cast<unsigned char>(text[place])) != 0) {
            ++place;
        }
        if (place == begin) { Fail("name expected"); }
        return text.substr(begin, place - begin);
    }
    char Peek() {
        SkipBlanks();
        return place < text.size() ? text[place] : '\0';
    }
    void Expect(char expected) {
        if (Peek() != expected) { Fail(std::string("'") + expected + "' expected"); }
        ++place;
    }
    void SkipBlanks() {
        while (place < text.size() && std::isspace(static_cast<unsigned char>(text[place])) != 0) {
            ++place;
        }
    }
    [[noreturn]] void Fail(const std::string& reason) const {
        throw std::runtime_error(reason + " at byte " + std::to_string(place));
    }

    std::string_view text;
    std::size_t place = 0;
    Memory& memory;
};

double Call(std::string_view name, const std::vector<double>& args) {
    if (name == "max") { return *std::max_element(args.begin(), args.end()); }
    if (name == "min") { return *std::min_element(args.begin(), args.end()); }
    if (name == "abs") { return std::fabs(args.front()); }
    throw std::runtime_error("unknown function '" + std::string(name) + "'");
}

using Values = std::unordered_map<std::string_view, double>;

double Evaluate(const Node& node, const Values& values) {
    const auto operand = [&](std::size_t index) { return Evaluate(*node.args[index], values); };
    switch (node.kind) {
        case Kind::Number:
            return node.value;
        case Kind::Sum:
            return operand(0) + operand(1);
        case Kind::Difference:
            return operand(0) - operand(1);
        case Kind::Product:
            return operand(0) * operand(1);
        case Kind::Quotient:
            return operand(0) / operand(1);
        case Kind::Variable: {
            const auto value = values.find(node.name);
            return value != values.end() ? value->second : 0.0;
        }
        case Kind::Call:
            break;
    }
    std::vector<double> args;
    for (std::size_t index = 0; index < node.args.size(); ++index) {
        args.push_back(operand(index));
    }
    return Call(node.name, args);
}

// Generates a text, the same on every machine.
std::string MadeText(int definitions) {
    std::string text;
    std::uint32_t seed = 1;
    const auto below = [&seed](std::uint32_t limit) {
        seed = seed * 1664525 + 1013904223;
        return (seed >> 8) % limit;
    };
    for (int number = 0; number < definitions; ++number) {
        const auto other = [&] { return "variable" + std::to_string(below(500)); };
        text += "let variable" + std::to_string(number % 500) + " = max(" + other() + ", 2 * " +
                std::to_string(below(100)) + ".5) + (" + other() + " - " +
                std::to_string(below(90)) + ") / 4 - min(abs(" + other() + "), 3, 17 * 0.25);\n";
    }
    return text;
}

double Seconds() {
    const auto now = std::chrono::steady_clock::now().time_since_epoch();
    return std::chrono::duration<double>(now).count();
}

template <typename Memory>
void Compile(const std::string& text, Memory& memory, bool report) {
    const double begin = Seconds();
    std::vector<Node*> roots;
    std::vector<std::string_view> names;
    Parser<Memory>(text, memory).ParseAll(roots, names);
    const double parsed = Seconds();

    Values values;
    double sum = 0;
    for (std::size_t index = 0; index < roots.size(); ++index) {
        sum += values[names[index]] = Evaluate(*roots[index], values);
    }
    const double evaluated = Seconds();
    if (report) { memory.Report(); }

    const double full = Seconds();
    memory.Drop(roots);
    const double dropped = Seconds();
    std::printf("%zu definitions, sum %.6g\n", roots.size(), sum);
    std::fprintf(stderr, "parse %.4f s, evaluate %.4f s, drop %.4f s\n", parsed - begin,
                 evaluated - parsed, dropped - full);
}

int Main(int argc, char** argv) {
    int definitions = 100000;
    bool useHeap = false;
    bool off = false;
    bool report = false;
    CommandLine line("Ast",
                     "Parses and evaluates a generated text, with its tree in a memory pool.");
    line.Number("--definitions", definitions, 1, 10000000, "Definitions in the text");
    line.Flag("--heap", useHeap, "Use new and delete instead of a pool");
    line.Flag("--off", off, "Disable the pool, so that a memory checker sees each block");
    line.Flag("--report", report, "Print the pool before the tree is dropped");
    int status = 0;
    if (!line.Read(argc, argv, status)) { return status; }

    const std::string text = MadeText(definitions);
    if (useHeap) {
        PlainMemory memory;
        Compile(text, memory, report);
    } else {
        PoolMemory memory(!off);
        Compile(text, memory, report);
    }
    return 0;
}

}  // namespace

int main(int argc, char** argv) {
    try {
        return Main(argc, argv);
    } catch (const std::exception& error) {
        std::fprintf(stderr, "Ast: %s\n", error.what());
        return 1;
    }
}
