/* Prints the outline of XML documents: which elements contain which, and how many of each.

       XmlOutline [--report] FILE...

   Each document has a heap of its own, for expat's blocks and for the outline. When the document is
   done, the heap is deleted, without a walk over the outline. --report first prints the pool's
   report on standard error.

   Expat's memory hooks have no context argument, so the heap that they use is a thread-local
   variable: each thread can then work on documents of its own. */

#include <MemPoolHeap.h>

#include <stdbool.h>
#include <stdio.h>
#include <string.h>

#include <expat.h>

static _Thread_local obr_heap* current;

static void* Allocate(size_t size) {
    return obr_heap_malloc(current, size);
}
static void* Reallocate(void* block, size_t size) {
    return obr_heap_realloc(current, block, size);
}
static void Free(void* block) {
    obr_heap_free(current, block);
}

static const XML_Memory_Handling_Suite hooks = {Allocate, Reallocate, Free};

/* All elements with the same name in one place of the outline. */
struct Element {
    struct Element* parent;
    struct Element* firstChild;
    struct Element* next; /* The next child of the parent. */
    unsigned long count;
    char name[];
};

struct Outline {
    XML_Parser parser;
    struct Element* open; /* The element that is being read. */
    bool isOutOfMemory;
};

static struct Element* NewElement(struct Element* parent, const char* name) {
    const size_t length = strlen(name) + 1;
    struct Element* const element = obr_heap_calloc(current, 1, sizeof *element + length);
    if (element == NULL) { return NULL; }
    element->parent = parent;
    memcpy(element->name, name, length);
    return element;
}

static void XMLCALL Open(void* data, const char* name, const char** attributes) {
    struct Outline* const outline = data;
    (void)attributes;
    struct Element** place = &outline->open->firstChild;
    while (*place != NULL && strcmp((*place)->name, name) != 0) { place = &(*place)->next; }
    if (*place == NULL) { *place = NewElement(outline->open, name); }
    if (*place == NULL) {
        outline->isOutOfMemory = true;
        XML_StopParser(outline->parser, XML_FALSE);
        return;
    }
    ++(*place)->count;
    outline->open = *place;
}

static void XMLCALL Close(void* data, const char* name) {
    struct Outline* const outline = data;
    (void)name;
    outline->open = outline->open->parent;
}

static void Print(const struct Element* element, int depth) {
    for (; element != NULL; element = element->next) {
        printf("%*s%s %lu\n", 2 * depth, "", element->name, element->count);
        Print(element->firstChild, depth + 1);
    }
}

/* Why the file could not be read as XML; null if it could. */
static const char* Read(FILE* file, struct Outline* outline) {
    XML_SetUserData(outline->parser, outline);
    XML_SetElementHandler(outline->parser, Open, Close);
    char buffer[1 << 14];
    size_t size = 0;
    do {
        size = fread(buffer, 1, sizeof buffer, file);
        if (ferror(file)) { return "cannot be read"; }
        if (XML_Parse(outline->parser, buffer, (int)size, size == 0) != XML_STATUS_OK) {
            return outline->isOutOfMemory ? obr_heap_error()
                                          : XML_ErrorString(XML_GetErrorCode(outline->parser));
        }
    } while (size != 0);
    return NULL;
}

/* The outline of a document whose blocks all come from `current`. */
static const char* PrintOutline(FILE* file) {
    struct Element* const root = NewElement(NULL, "");
    struct Outline outline = {XML_ParserCreate_MM(NULL, &hooks, NULL), root, false};
    if (root == NULL || outline.parser == NULL) { return obr_heap_error(); }
    const char* const problem = Read(file, &outline);
    if (problem == NULL) { Print(root->firstChild, 0); }
    return problem;
}

static bool Run(const char* name, bool report) {
    FILE* const file = fopen(name, "rb");
    if (file == NULL) {
        perror(name);
        return false;
    }
    const char* problem = NULL;
    current = obr_heap_new(NULL, NULL);
    if (current == NULL) {
        problem = obr_heap_error();
    } else {
        problem = PrintOutline(file);
        if (report) { obr_heap_report(current, stderr); }
    }
    if (problem != NULL) { fprintf(stderr, "XmlOutline: %s: %s\n", name, problem); }
    obr_heap_delete(current);
    fclose(file);
    return problem == NULL;
}

int main(int argc, char** argv) {
    const bool report = argc > 1 && strcmp(argv[1], "--report") == 0;
    const int first = report ? 2 : 1;
    if (argc <= first) {
        fputs("usage: XmlOutline [--report] FILE...\n", stderr);
        return 2;
    }
    bool success = true;
    for (int at = first; at < argc; ++at) { success = Run(argv[at], report) && success; }
    return success ? 0 : 1;
}
