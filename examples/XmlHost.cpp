// Reads XML documents with libxml2, each into a heap of its own. When a document is done, its heap
// is dropped as a whole; xmlFreeDoc would walk the document and free node by node. With --heap the
// blocks come from the C library's malloc, for comparison.

#include <MemPoolHeap>

#include <fcntl.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <exception>
#include <string>
#include <vector>

#include <libxml/parser.h>
#include <libxml/tree.h>

#include "CommandLine.hpp"

namespace {

using OBR::MemPool::Heap;
using OBR::MemPool::HeapSettings;

struct Options {
    std::vector<std::string> files;
    bool useMalloc = false;
    bool off = false;
    bool close = false;
};

// libxml2's hooks have no context argument. While no document is read, blocks come from `library`,
// since data for all documents must outlive each of them.
Heap* library = nullptr;
Heap* document = nullptr;

void* Malloc(std::size_t size) {
    return (document != nullptr ? document : library)->Malloc(size);
}

// A heap refuses the blocks of another heap.
void Free(void* block) {
    if (document == nullptr || !document->Free(block)) { library->Free(block); }
}

void* Realloc(void* block, std::size_t size) {
    if (block == nullptr) { return Malloc(size); }
    const bool isOfDocument = document != nullptr && document->UsableSize(block) != 0;
    return (isOfDocument ? document : library)->Realloc(block, size);
}

char* Duplicate(const char* text) {
    const std::size_t size = std::strlen(text) + 1;
    void* const copy = Malloc(size);
    return copy == nullptr ? nullptr : static_cast<char*>(std::memcpy(copy, text, size));
}

struct Figures {
    std::size_t elements = 0;
    std::size_t textBytes = 0;
};

void Count(const xmlNode* node, Figures& figures) {
    for (; node != nullptr; node = node->next) {
        if (node->type == XML_ELEMENT_NODE) {
            ++figures.elements;
            Count(node->children, figures);
        } else {
            figures.textBytes += static_cast<std::size_t>(xmlStrlen(node->content));
        }
    }
}

// Reads from a descriptor. libxml2 would look up a name in its catalogs, which it reads when it
// first needs them, and which would then be dropped with the document.
bool Read(const std::string& file, bool close) {
    const int descriptor = open(file.c_str(), O_RDONLY | O_CLOEXEC);
    if (descriptor < 0) {
        std::perror(file.c_str());
        return false;
    }
    xmlDoc* const made = xmlReadFd(descriptor, file.c_str(), nullptr, XML_PARSE_HUGE);
    ::close(descriptor);
    if (made != nullptr) {
        Figures figures;
        Count(xmlDocGetRootElement(made), figures);
        std::printf("%s: %zu elements, %zu bytes of text\n", file.c_str(), figures.elements,
                    figures.textBytes);
        if (close) { xmlFreeDoc(made); }
    }
    xmlResetLastError();  // The copy of the last message is in the document's heap too.
    return made != nullptr;
}

bool ReadAll(const Options& options) {
    bool success = true;
    for (const std::string& file : options.files) {
        if (options.useMalloc) {
            success = Read(file, true) && success;
        } else {
            Heap heap(nullptr, HeapSettings().On(!options.off));
            document = &heap;
            success = Read(file, options.close) && success;
            heap.FreeAll();
            document = nullptr;
        }
    }
    return success;
}

int Main(int argc, char** argv) {
    Options options;
    CommandLine line("XmlHost", "Reads XML files, each into a memory pool of its own.");
    line.Files("FILE", options.files, "XML files");
    line.Flag("--heap", options.useMalloc, "Use the C library's malloc instead of pools");
    line.Flag("--off", options.off, "Disable pools, so that a memory checker sees each block");
    line.Flag("--close", options.close, "Free each document node by node before its heap");
    int status = 0;
    if (!line.Read(argc, argv, status)) { return status; }

    Heap heap("libxml2", HeapSettings().On(!options.off));
    library = &heap;
    if (!options.useMalloc) { xmlMemSetup(Free, Malloc, Realloc, Duplicate); }
    xmlInitParser();
    const bool success = ReadAll(options);
    xmlCleanupParser();
    return success ? 0 : 1;
}

}  // namespace

int main(int argc, char** argv) {
    try {
        return Main(argc, argv);
    } catch (const std::exception& error) {
        std::fprintf(stderr, "XmlHost: %s\n", error.what());
        return 1;
    }
}
