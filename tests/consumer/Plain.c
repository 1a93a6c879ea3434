/* A host in C. */

#include <MemPoolHeap.h>

#include <string.h>

int main(void) {
    obr_heap_settings settings = {.struct_size = sizeof settings, .alignment = 16};
    obr_heap* const heap = obr_heap_new("plain", &settings);
    if (heap == NULL || obr_heap_new("plain", NULL) != NULL) { return 1; }
    if (strcmp(obr_heap_error(), "there is a pool named 'plain' already") != 0) { return 2; }
    char* const text = obr_heap_call(heap, NULL, 0, 24);
    if ((size_t)text % 16 != 0 || obr_heap_usable_size(heap, text) < 24) { return 3; }
    obr_heap_delete(heap);
    settings.struct_size = 0;
    return obr_heap_new("plain", &settings) == NULL ? 0 : 4;
}
