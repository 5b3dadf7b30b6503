// Stand-in for the core library: model queries, string lists and hashes,
// sectioned text files, the physical memory size.
#include <map>
#include <new>

#include "standin_state.h"

using korvstandin::Fault;
using korvstandin::detail::Current;
using korvstandin::detail::Domain;
using korvstandin::Op;
using korvstandin::detail::Enter;
using korvstandin::detail::Guarded;
using korvstandin::detail::Text;

struct KLIBCSzList {
    std::vector<std::string> items;
};

struct KLIBCSzHash {
    std::map<std::string, std::string> values;
};

namespace korvstandin::detail {

KLIBCSzList *NewSzList(const std::vector<std::string> &items) { return new KLIBCSzList{items}; }

void FreeSzList(KLIBCSzList *list) { delete list; }

}  // namespace korvstandin::detail

extern "C" {

int KLIBCIsQuillbox(void)
{
    Enter(Op::KLIBCIsQuillbox);
    return Current(Domain::Model).quillbox ? 1 : 0;
}

unsigned int KLIBSystemPhysMemSizeGet(void)
{
    if (Enter(Op::KLIBSystemPhysMemSizeGet) != Fault::None)
        return 0;
    return Current(Domain::Memory).physMemSize;
}

int KLIBCSzListFind(const KLIBCSzList *list, const char *text)
{
    if (Enter(Op::KLIBCSzListFind, Text(text)) != Fault::None || list == nullptr ||
        text == nullptr)
        return -1;
    for (size_t i = 0; i < list->items.size(); ++i)
        if (list->items[i] == text)
            return static_cast<int>(i);
    return -1;
}

KLIBCSzHash *KLIBCSzHashAlloc(int size)
{
    if (Enter(Op::KLIBCSzHashAlloc, size) != Fault::None || size <= 0)
        return nullptr;
    auto *hash = new (std::nothrow) KLIBCSzHash;
    if (hash == nullptr) {
        korvstandin::detail::OutOfMemory(Op::KLIBCSzHashAlloc);
        return nullptr;
    }
    korvstandin::detail::Allocated();
    return hash;
}

int KLIBCSzHashSetValue(KLIBCSzHash **hash, const char *key, const char *value)
{
    if (Enter(Op::KLIBCSzHashSetValue, Text(key), Text(value)) != Fault::None)
        return -1;
    if (hash == nullptr || *hash == nullptr || key == nullptr || value == nullptr) {
        korvstandin::detail::SetLastError(0x0D02, "core", __LINE__);
        return -1;
    }
    return Guarded(Op::KLIBCSzHashSetValue, -1, [&] {
        (*hash)->values[key] = value;
        return 0;
    });
}

const char *KLIBCSzHashGetValue(const KLIBCSzHash *hash, const char *key)
{
    if (Enter(Op::KLIBCSzHashGetValue, Text(key)) != Fault::None || hash == nullptr ||
        key == nullptr)
        return nullptr;
    return Guarded(Op::KLIBCSzHashGetValue, static_cast<const char *>(nullptr), [&] {
        auto found = hash->values.find(key);
        return found == hash->values.end() ? nullptr : found->second.c_str();
    });
}

void KLIBCSzHashFree(KLIBCSzHash *hash)
{
    Enter(Op::KLIBCSzHashFree);
    if (hash == nullptr)
        return;
    korvstandin::detail::Released();
    delete hash;
}

int KLIBCFileGetSectionValue(const char *path, const char *section, const char *key,
                             char *buffer, int size)
{
    if (Enter(Op::KLIBCFileGetSectionValue, Text(path), Text(section), Text(key), size) !=
        Fault::None)
        return -1;
    if (path == nullptr || section == nullptr || key == nullptr || buffer == nullptr ||
        size <= 0)
        return -1;
    return Guarded(Op::KLIBCFileGetSectionValue, -1, [&] {
        const auto &files = Current(Domain::Files).files;
        auto file = files.find(path);
        if (file == files.end())
            return -1;
        auto sectionEntry = file->second.find(section);
        if (sectionEntry == file->second.end())
            return -1;
        auto value = sectionEntry->second.find(key);
        if (value == sectionEntry->second.end())
            return -1;
        korvstandin::detail::CopyText(buffer, static_cast<size_t>(size), value->second);
        return 0;
    });
}

}  // extern "C"
