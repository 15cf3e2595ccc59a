// The reference host's metadata list: entries copied in order of arrival,
// linked through `next`, each block owned by the list once accepted.

#include <cstdlib>

#include "pivlo/pivlo.h"

namespace {

void* ListAlloc(const MetadataList* list, uint32_t n) {
    return list->allocProc ? list->allocProc(n) : std::malloc(n);
}

void ListFree(const MetadataList* list, void* block) {
    if (list->freeProc) list->freeProc(block);
    else std::free(block);
}

// The list keeps its last entry in its `reserved` member so that appending
// stays constant-time.
MetadataEntry*& Tail(MetadataList* list) {
    return reinterpret_cast<MetadataEntry*&>(list->reserved);
}

// The C heap, for lists created without procedures of their own.
void* HeapAlloc(uint32_t n) { return std::malloc(n ? n : 1); }
void HeapFree(void* block) { std::free(block); }

}  // namespace

extern "C" {

MetadataList* pivloCreateMetadataList(MetadataAllocProc allocProc, MetadataFreeProc freeProc) {
    if (!allocProc || !freeProc) {
        allocProc = HeapAlloc;
        freeProc = HeapFree;
    }
    void* block = allocProc(sizeof(MetadataList));
    if (!block) return nullptr;
    auto* list = static_cast<MetadataList*>(block);
    list->allocProc = allocProc;
    list->freeProc = freeProc;
    list->reserved = nullptr;
    list->head = nullptr;
    return list;
}

int zanAddToMetadataList(ConversionContext*, MetadataList* list, const MetadataEntry* entry) {
    if (!list || !entry) return 0;
    auto* copy = static_cast<MetadataEntry*>(ListAlloc(list, sizeof(MetadataEntry)));
    if (!copy) return 0;
    *copy = *entry;
    copy->next = nullptr;
    if (MetadataEntry* last = Tail(list)) last->next = copy;
    else list->head = copy;
    Tail(list) = copy;
    return 1;
}

const MetadataEntry* pivloMetadataListFirst(const MetadataList* list) {
    return list ? list->head : nullptr;
}

uint32_t pivloMetadataListLength(const MetadataList* list) {
    uint32_t n = 0;
    for (const MetadataEntry* e = pivloMetadataListFirst(list); e; e = e->next) ++n;
    return n;
}

void pivloDestroyMetadataList(MetadataList* list) {
    if (!list) return;
    MetadataEntry* entry = list->head;
    while (entry) {
        MetadataEntry* next = entry->next;
        if (entry->type == ZAN_METADATA_BLOCK && entry->value.block)
            ListFree(list, entry->value.block);
        ListFree(list, entry);
        entry = next;
    }
    ListFree(list, list);
}

}  // extern "C"
