// The storage-space section of the statistics result: the I/O records of the
// block devices that carry a storage space, named after the space. A space
// behind a flash cache is reported through the cache's layered device.
#include "korvsnmp/fill_in_current_space_io.h"

#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstring>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include <korv_storage.h>

#include "json_read.h"
#include "json_take.h"
#include "platform_text.h"
#include "protocol/unit_log.h"

namespace {

constexpr char kLogUnit[] = "fill_in_current_space_io";

constexpr int kSpaceEnumFlags = 1;
constexpr int kFlashCacheFlags = 0;
constexpr int kLayerPathFlags = 1;

constexpr size_t kDisplayNameSize = 1024;
constexpr size_t kLayerPathSize = 128;
constexpr size_t kLinkPathSize = 1024;
constexpr size_t kLinkTargetSize = 1024;
constexpr char kSysBlockLinkFormat[] = "/sys/dev/block/%llu:%llu";

constexpr char kDeviceKey[] = "device";
constexpr char kTotalDevice[] = "total";
constexpr char kDisplayNameKey[] = "display_name";
constexpr char kVolumeKey[] = "volume";
constexpr char kTotalKey[] = "total";

// Kernel name of a block device -> display name of the space it carries.
using SpaceNameMap = std::map<std::string, std::string>;
using LinkTarget = std::array<char, kLinkTargetSize>;

using SpaceList = std::unique_ptr<SpaceInfo, decltype(&KORVSpaceInfoFree)>;
using FlashCacheList = std::unique_ptr<FlashCacheConfig, decltype(&KORVFlashCacheConfigFree)>;

// `text` as it fits a display-name buffer: at most its first 1023 characters
// (cutting a longer text is intended).
std::string DisplayName(const std::string &text) { return text.substr(0, kDisplayNameSize - 1); }

// Reads the sysfs link of the block device that the node at `path` stands
// for into `target`, which always stays terminated. True when the target has
// at least one character; false for a missing node, one that is no block
// device, or a device without a readable link.
bool GetBlockDevLink(const char *path, LinkTarget &target)
{
    struct stat status;
    if (stat(path, &status) != 0 || !S_ISBLK(status.st_mode))
        return false;

    char linkPath[kLinkPathSize] = {};
    std::snprintf(linkPath, sizeof linkPath, kSysBlockLinkFormat,
                  static_cast<unsigned long long>(major(status.st_rdev)),
                  static_cast<unsigned long long>(minor(status.st_rdev)));

    // readlink() writes no terminator: the last byte stays zero, also for a
    // target that fills the buffer (which is then cut).
    target.fill('\0');
    return readlink(linkPath, target.data(), target.size() - 1) >= 1;
}

// The kernel name of the block device that the node at `path` stands for;
// empty when it cannot be had.
std::string KernelName(const char *path)
{
    LinkTarget target;
    if (!GetBlockDevLink(path, target))
        return std::string();
    // GNU basename() from <cstring>: the text after the last '/'; it leaves
    // its argument alone (libgen.h's variant must not be included here).
    return basename(target.data());
}

// Names the layered device of every flash cache after the cached volume and
// notes, per named cache, the space path whose own device is then left out.
void AddFlashCacheNames(SpaceNameMap &names, std::vector<std::string> &cachedSpaces)
{
    FlashCacheConfig *head = nullptr;
    const int found = KORVFlashCacheConfigGet(kFlashCacheFlags, &head);
    const FlashCacheList caches(head, &KORVFlashCacheConfigFree);
    if (found <= 0)
        return;

    for (const FlashCacheConfig *cache = caches.get(); cache != nullptr; cache = cache->next) {
        if (cache->volumePath == nullptr || cache->spacePath == nullptr)
            continue;
        const SpaceLayerRef reference = {cache->volumePath, cache->spacePath};
        char layerPath[kLayerPathSize] = {};
        if (KORVVSpaceLayerPathGet(kLayerPathFlags, &reference, layerPath,
                                   static_cast<int>(sizeof layerPath)) < 0)
            continue;
        layerPath[sizeof layerPath - 1] = '\0';

        const std::string key = KernelName(layerPath);
        if (key.empty())
            continue;
        cachedSpaces.emplace_back(cache->spacePath);
        const char *volumePath = cache->volumePath;
        if (volumePath[0] == '/')
            ++volumePath;
        names[key] = DisplayName(volumePath);
    }
}

// Removes the first entry of `cachedSpaces` equal to `devicePath`; true when
// there was one.
bool TakeCachedSpace(std::vector<std::string> &cachedSpaces, const std::string &devicePath)
{
    const auto cached = std::find(cachedSpaces.begin(), cachedSpaces.end(), devicePath);
    if (cached == cachedSpaces.end())
        return false;
    cachedSpaces.erase(cached);
    return true;
}

bool EnumSpaceNames(SpaceNameMap &names)
{
    SpaceInfo *head = nullptr;
    const int enumerated = KORVSpaceInfoEnum(kSpaceEnumFlags, &head);
    const SpaceList spaces(head, &KORVSpaceInfoFree);
    if (enumerated < 0) {
        KORVSNMP_LOG(LOG_ERR, "Failed to enum space info");
        return false;
    }

    std::vector<std::string> cachedSpaces;
    AddFlashCacheNames(names, cachedSpaces);

    for (const SpaceInfo *space = spaces.get(); space != nullptr; space = space->next) {
        const std::string devicePath = korvread::FieldText(space->devicePath);
        if (TakeCachedSpace(cachedSpaces, devicePath))
            continue;
        std::string name = DisplayName(korvread::FieldText(space->name));
        const std::string key = KernelName(devicePath.c_str());
        if (!key.empty())
            names[key] = std::move(name);
    }
    return true;
}

// `Records` is const Json::Value (the records are copied) or Json::Value
// (they are moved out).
template <typename Records>
bool FillIn(Records &spaceIO, Json::Value &space)
{
    if (!spaceIO.isArray()) {
        KORVSNMP_LOG(LOG_ERR, "SpaceIO is not array.");
        return false;
    }
    SpaceNameMap names;
    if (!EnumSpaceNames(names))
        return false;

    Json::Value volumes(Json::arrayValue);
    Records *total = nullptr;
    for (Json::ArrayIndex index = 0; index < spaceIO.size(); ++index) {
        Records &record = spaceIO[index];
        if (!korvread::IsRecord(record)) {
            KORVSNMP_LOG(LOG_ERR, "SpaceIO element %u is not an object", index);
            return false;
        }
        std::string deviceName;
        if (!korvread::ReadDeviceName(record, deviceName)) {
            KORVSNMP_LOG(LOG_ERR, "SpaceIO element %u: \"%s\" is not a string", index,
                         kDeviceKey);
            return false;
        }
        if (deviceName == kTotalDevice) {
            total = &record;
            continue;
        }
        const auto named = names.find(deviceName);
        if (named == names.end() || named->second.empty())
            continue;
        Json::Value volume = korvsnmp::Take(record);
        volume[kDisplayNameKey] = named->second;
        volumes.append(std::move(volume));
    }

    if (!korvread::IsRecord(space))
        space = Json::Value(Json::objectValue);
    if (total != nullptr)
        space[kTotalKey] = korvsnmp::Take(*total);
    space[kVolumeKey] = std::move(volumes);
    return true;
}

}  // namespace

namespace KORVSNMP {

bool FillInCurrentSpaceIO(const Json::Value &spaceIO, Json::Value &space)
{
    return FillIn(spaceIO, space);
}

bool FillInCurrentSpaceIO(Json::Value &&spaceIO, Json::Value &space) { return FillIn(spaceIO, space); }

}  // namespace KORVSNMP
