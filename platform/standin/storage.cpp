// Stand-in for the storage services.
#include <cstring>
#include <optional>

#include "standin_state.h"

using korvstandin::Fault;
using korvstandin::detail::Current;
using korvstandin::detail::Domain;
using korvstandin::Op;
using korvstandin::detail::CopyText;
using korvstandin::detail::Enter;
using korvstandin::detail::Guarded;

namespace {

void FreeSpaceList(SpaceInfo *list)
{
    while (list != nullptr) {
        SpaceInfo *next = list->next;
        delete list;
        list = next;
    }
}

SpaceInfo *BuildSpaceList(const std::vector<korvstandin::Space> &spaces)
{
    SpaceInfo *head = nullptr;
    SpaceInfo **tail = &head;
    try {
        for (const korvstandin::Space &space : spaces) {
            auto *node = new SpaceInfo{};
            CopyText(node->devicePath, sizeof node->devicePath, space.devicePath);
            CopyText(node->name, sizeof node->name, space.name);
            *tail = node;
            tail = &node->next;
        }
    } catch (const std::bad_alloc &) {
        FreeSpaceList(head);
        throw;
    }
    if (head != nullptr)
        korvstandin::detail::Allocated();
    return head;
}

// A copy of the text, or null for none.
char *Duplicate(const std::optional<std::string> &text)
{
    if (!text)
        return nullptr;
    char *copy = new char[text->size() + 1];
    std::memcpy(copy, text->c_str(), text->size() + 1);
    return copy;
}

void FreeFlashCacheList(FlashCacheConfig *list)
{
    while (list != nullptr) {
        FlashCacheConfig *next = list->next;
        delete[] list->spacePath;
        delete[] list->volumePath;
        delete list;
        list = next;
    }
}

FlashCacheConfig *BuildFlashCacheList(const std::vector<korvstandin::FlashCache> &caches)
{
    FlashCacheConfig *head = nullptr;
    FlashCacheConfig **tail = &head;
    try {
        for (const korvstandin::FlashCache &cache : caches) {
            *tail = new FlashCacheConfig{};
            FlashCacheConfig *node = *tail;
            tail = &node->next;
            node->spacePath = Duplicate(cache.spacePath);
            node->volumePath = Duplicate(cache.volumePath);
        }
    } catch (const std::bad_alloc &) {
        FreeFlashCacheList(head);
        throw;
    }
    if (head != nullptr)
        korvstandin::detail::Allocated();
    return head;
}

}  // namespace

extern "C" {

int KORVSpaceInfoEnum(int flags, SpaceInfo **list)
{
    Fault fault = Enter(Op::KORVSpaceInfoEnum, flags);
    if (list == nullptr || fault == Fault::Fail)
        return -1;
    return Guarded(Op::KORVSpaceInfoEnum, -1, [&] {
        *list = BuildSpaceList(Current(Domain::Storage).spaces);
        return fault == Fault::None ? 0 : -1;
    });
}

void KORVSpaceInfoFree(SpaceInfo *list)
{
    Enter(Op::KORVSpaceInfoFree);
    if (list == nullptr)
        return;
    korvstandin::detail::Released();
    FreeSpaceList(list);
}

int KORVFlashCacheConfigGet(int flags, FlashCacheConfig **list)
{
    Fault fault = Enter(Op::KORVFlashCacheConfigGet, flags);
    if (list == nullptr || fault == Fault::Fail)
        return -1;
    return Guarded(Op::KORVFlashCacheConfigGet, -1, [&] {
        const auto &caches = Current(Domain::Storage).flashCaches;
        *list = BuildFlashCacheList(caches);
        return fault == Fault::None ? static_cast<int>(caches.size()) : -1;
    });
}

void KORVFlashCacheConfigFree(FlashCacheConfig *list)
{
    Enter(Op::KORVFlashCacheConfigFree);
    if (list == nullptr)
        return;
    korvstandin::detail::Released();
    FreeFlashCacheList(list);
}

int KORVVSpaceLayerPathGet(int flags, const SpaceLayerRef *ref, char *buffer, int size)
{
    const char *volumePath = ref && ref->volumePath ? ref->volumePath : "(null)";
    const char *spacePath = ref && ref->spacePath ? ref->spacePath : "(null)";
    if (Enter(Op::KORVVSpaceLayerPathGet, flags, volumePath, spacePath, size) != Fault::None)
        return -1;
    if (ref == nullptr || ref->volumePath == nullptr || ref->spacePath == nullptr ||
        buffer == nullptr || size <= 0)
        return -1;
    return Guarded(Op::KORVVSpaceLayerPathGet, -1, [&] {
        for (const korvstandin::FlashCache &cache : Current(Domain::Storage).flashCaches) {
            if (cache.volumePath != ref->volumePath || cache.spacePath != ref->spacePath)
                continue;
            if (cache.layerFails)
                return -1;
            CopyText(buffer, static_cast<size_t>(size), cache.layerPath);
            return 0;
        }
        return -1;
    });
}

}  // extern "C"
