// The disk section: names every disk that the host knows (internal bays,
// expansion units, dedicated SSD caches, USB and eSATA devices) and turns the
// collector's per-disk counters into named disk records and their total.
#include <algorithm>
#include <cstdarg>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <map>
#include <memory>
#include <new>
#include <string>

#include <korv_platform.h>

#include "json_read.h"
#include "json_take.h"
#include "korvsnmp/fill_in_current_disk_io.h"
#include "platform_text.h"
#include "protocol/unit_log.h"

namespace {

constexpr char kLogUnit[] = "fill_in_current_disk_io";

constexpr int kDiskContainerMask =
    DISK_CONTAINER_INTERNAL | DISK_CONTAINER_EBOX | DISK_CONTAINER_SSD_CACHE;
constexpr char kDevicePrefix[] = "/dev/";
constexpr size_t kDevicePrefixLength = sizeof kDevicePrefix - 1;

constexpr char kStringsFile[] = "/usr/korv/korvman/webman/texts/enu/strings";
constexpr char kStringsSection[] = "volume";
constexpr char kTextDisk[] = "volume_disk";
constexpr char kTextExpansion[] = "volume_expansion";
constexpr char kTextSsdCache[] = "dedicated_ssd_cache";
constexpr const char *kTextKeys[] = {kTextDisk, kTextExpansion, kTextSsdCache};
constexpr int kTextTableSize = 1024;

constexpr size_t kTextSize = 256;
constexpr size_t kDisplayNameSize = 256;
constexpr size_t kUnitLabelSize = 32;
constexpr size_t kSlotTextSize = 8;
constexpr char kDroppedModelPrefix[] = "Korvel-";
constexpr size_t kDroppedModelPrefixLength = sizeof kDroppedModelPrefix - 1;
// A negative group index marks a slot that users count from ten less.
constexpr long long kUngroupedSlotOffset = 10;

// The information query's flag for the kind of device.
constexpr int kInfoFlagUsb = 1;
constexpr int kInfoFlagOther = 0;

constexpr char kTypeInternal[] = "internal";
constexpr char kTypeEBox[] = "ebox";
constexpr char kTypeUsb[] = "usb";
constexpr char kTypeESata[] = "eSATA";

constexpr char kTotalDevice[] = "total";
constexpr const char *kCounterNames[] = {"utilization", "read_access", "read_byte",
                                         "write_access", "write_byte"};
constexpr size_t kCounterCount = sizeof kCounterNames / sizeof kCounterNames[0];
constexpr size_t kUtilizationCounter = 0;

struct DiskName {
    std::string displayName;  // empty: the device is unknown
    std::string type;
};

// Ordered by device name, byte-wise.
using DiskNameMap = std::map<std::string, DiskName>;

// Formats into `buffer` of `size` bytes, cut to fit.
__attribute__((format(printf, 3, 4))) void FormatCut(char *buffer, size_t size,
                                                     const char *format, ...)
{
    va_list args;
    va_start(args, format);
    if (std::vsnprintf(buffer, size, format, args) < 0)
        buffer[0] = '\0';
    va_end(args);
}

// ---- Internal and expansion-unit disks ----------------------------------------

using DiskList = std::unique_ptr<DiskInfoList, decltype(&DiskInfoEnumFree)>;
using UnitList = std::unique_ptr<EBoxInfo, decltype(&KORVEBoxInfoEnumFree)>;

struct EBoxWrapper {
    const EBoxInfo *unit;
    bool powered;
    EBoxWrapper *next;
};

// The wrappers of one pass, in unit order; freed one by one.
class EBoxWrapperList {
public:
    EBoxWrapperList() = default;
    EBoxWrapperList(const EBoxWrapperList &) = delete;
    EBoxWrapperList &operator=(const EBoxWrapperList &) = delete;
    ~EBoxWrapperList()
    {
        while (head_ != nullptr) {
            EBoxWrapper *next = head_->next;
            delete head_;
            head_ = next;
        }
    }

    // False when no wrapper could be allocated.
    bool Append(const EBoxInfo *unit)
    {
        auto *wrapper = new (std::nothrow) EBoxWrapper{};
        if (wrapper == nullptr)
            return false;
        wrapper->unit = unit;
        wrapper->powered = KORVEBoxIsPoweron(unit) != 0;
        *tail_ = wrapper;
        tail_ = &wrapper->next;
        return true;
    }

    const EBoxWrapper *Head() const { return head_; }

private:
    EBoxWrapper *head_ = nullptr;
    EBoxWrapper **tail_ = &head_;
};

// The localized texts of one disk; the hash may be missing when the platform
// could not allocate it, and is released in any case.
class TextTable {
public:
    TextTable() : hash_(KLIBCSzHashAlloc(kTextTableSize)) {}
    TextTable(const TextTable &) = delete;
    TextTable &operator=(const TextTable &) = delete;
    ~TextTable() { KLIBCSzHashFree(hash_); }

    bool Allocated() const { return hash_ != nullptr; }
    KLIBCSzHash **Hash() { return &hash_; }
    const KLIBCSzHash *Hash() const { return hash_; }

private:
    KLIBCSzHash *hash_;
};

void LoadVolumeText(const char *key, TextTable &table)
{
    char text[kTextSize] = {};
    if (KLIBCFileGetSectionValue(kStringsFile, kStringsSection, key, text, sizeof text) < 0) {
        KORVSNMP_LOG(LOG_ERR, "Fail to get text [volume:%s]", key);
        return;
    }
    if (KLIBCSzHashSetValue(table.Hash(), key, text) < 0) {
        unsigned int code = KLIBCErrGet();
        const char *file = KLIBCErrorGetFile();
        int line = KLIBCErrorGetLine();
        KORVSNMP_LOG(LOG_ERR, "KLIBCSzHashSetValue failed[0x%04X %s:%d]", code,
                     file != nullptr ? file : "", line);
    }
}

std::string GetVolumeText(const TextTable &table, const char *key)
{
    const char *text = table.Allocated() ? KLIBCSzHashGetValue(table.Hash(), key) : nullptr;
    return text != nullptr ? korvread::FieldText(text, kTextSize) : std::string();
}

// The first powered unit whose disk-path list holds `devicePath`, or null.
const EBoxInfo *FindPoweredUnit(const EBoxWrapper *wrappers, const char *devicePath)
{
    for (const EBoxWrapper *wrapper = wrappers; wrapper != nullptr; wrapper = wrapper->next)
        if (wrapper->powered && KLIBCSzListFind(wrapper->unit->diskPaths, devicePath) >= 0)
            return wrapper->unit;
    return nullptr;
}

// "<model>-<unit number>" cut to fit, without the model's "Korvel-" prefix.
std::string UnitLabel(const EBoxInfo &unit)
{
    const char *model = unit.modelName(&unit.identity);
    char label[kUnitLabelSize] = {};
    FormatCut(label, sizeof label, "%s-%u", model != nullptr ? model : "", unit.unitNumber);
    const char *shown = label;
    if (std::strncmp(label, kDroppedModelPrefix, kDroppedModelPrefixLength) == 0)
        shown += kDroppedModelPrefixLength;
    return shown;
}

std::string SlotText(const DiskInfo &disk)
{
    char slot[kSlotTextSize] = {};
    if (disk.groupIndex > 0)
        FormatCut(slot, sizeof slot, "%d-%d", disk.groupIndex, disk.diskNumber);
    else if (disk.groupIndex == 0)
        FormatCut(slot, sizeof slot, "%d", disk.diskNumber);
    else
        FormatCut(slot, sizeof slot, "%lld", disk.diskNumber - kUngroupedSlotOffset);
    return slot;
}

// The display name and type of `disk`; for a container that names no disk
// (a bad disk), an empty display name and no type.
DiskName GetDiskDisplayName(const DiskInfo &disk, const EBoxWrapper *wrappers)
{
    TextTable table;
    if (table.Allocated())
        for (const char *key : kTextKeys)
            LoadVolumeText(key, table);
    char devicePath[DISK_DEVICE_PATH_SIZE + 1] = {};
    std::memcpy(devicePath, disk.devicePath, sizeof disk.devicePath);
    const EBoxInfo *unit = FindPoweredUnit(wrappers, devicePath);

    DiskName name;
    char displayName[kDisplayNameSize] = {};
    const std::string diskText = GetVolumeText(table, kTextDisk);
    switch (disk.container) {
    case DISK_CONTAINER_EBOX: {
        const std::string unitText = unit != nullptr && unit->modelName != nullptr
                                         ? UnitLabel(*unit)
                                         : GetVolumeText(table, kTextExpansion);
        FormatCut(displayName, sizeof displayName, "%s %d (%s)", diskText.c_str(),
                  disk.diskNumber, unitText.c_str());
        name.type = kTypeEBox;
        break;
    }
    case DISK_CONTAINER_INTERNAL:
        FormatCut(displayName, sizeof displayName, "%s %d", diskText.c_str(), disk.diskNumber);
        name.type = kTypeInternal;
        break;
    case DISK_CONTAINER_SSD_CACHE:
        FormatCut(displayName, sizeof displayName, "%s %s",
                  GetVolumeText(table, kTextSsdCache).c_str(), SlotText(disk).c_str());
        name.type = kTypeInternal;
        break;
    default:
        KORVSNMP_LOG(LOG_ERR, "bad container: %d", disk.container);
        return name;
    }
    name.displayName = displayName;
    return name;
}

std::string DeviceNameOf(const DiskInfo &disk)
{
    std::string path = korvread::FieldText(disk.devicePath, sizeof disk.devicePath);
    if (path.compare(0, kDevicePrefixLength, kDevicePrefix) == 0)
        path.erase(0, kDevicePrefixLength);
    return path;
}

bool EnumInternalDiskNames(DiskNameMap &names)
{
    DiskFilter filter{};
    filter.containerMask = kDiskContainerMask;
    DiskInfoList *diskHead = nullptr;
    int result = DiskInfoEnum(&filter, &diskHead);
    DiskList disks(diskHead, &DiskInfoEnumFree);
    if (result < 0) {
        KORVSNMP_LOG(LOG_ERR, "Failed to enum disks");
        return false;
    }

    UnitList units(nullptr, &KORVEBoxInfoEnumFree);
    if (SupportEBox() != 0) {
        EBoxInfo *unitHead = nullptr;
        result = KORVEBoxInfoEnum(&unitHead);
        units.reset(unitHead);
        if (result < 0) {
            KORVSNMP_LOG(LOG_ERR, "Failed to enum ebox");
            return false;
        }
    }

    EBoxWrapperList wrappers;
    for (const EBoxInfo *unit = units.get(); unit != nullptr; unit = unit->next) {
        if (!wrappers.Append(unit)) {
            KORVSNMP_LOG(LOG_ERR, "Failed to allocate ebox wrapper");
            break;
        }
    }

    for (const DiskInfoList *node = disks.get(); node != nullptr; node = node->next) {
        if (node->disk == nullptr || (node->disk->container & kDiskContainerMask) == 0)
            continue;
        DiskName &entry = names[DeviceNameOf(*node->disk)];
        DiskName name = GetDiskDisplayName(*node->disk, wrappers.Head());
        entry.displayName = std::move(name.displayName);
        if (!name.type.empty())
            entry.type = std::move(name.type);
    }
    return true;
}

// ---- External devices ---------------------------------------------------------

bool KORVExternalDevEnum(DiskNameMap &names, int kind)
{
    // A negative size is no answer either.
    int needed = 0;
    if (KORVUSBDevEnum(kind, nullptr, 0, &needed) < 0 || needed < 0) {
        KORVSNMP_LOG(LOG_ERR, "Failed to KORVExternalDevEnum EXTERNAL_USB_DEVICE");
        return false;
    }
    const int blockSize = needed;
    std::unique_ptr<char[]> block(new (std::nothrow) char[static_cast<size_t>(blockSize)]());
    if (!block) {
        KORVSNMP_LOG(LOG_ERR, "KORVExternalDevEnum error: Out of Memory");
        return false;
    }
    int count = KORVUSBDevEnum(kind, reinterpret_cast<char **>(block.get()), blockSize, &needed);
    if (count < 0) {
        KORVSNMP_LOG(LOG_ERR, "KORVExternalDevEnum: Error KORVUSBDevEnum");
        return false;
    }
    if (count == 0)
        return true;

    const bool isUsb = kind == EXTERNAL_USB_DEVICE;
    const char *type = isUsb ? kTypeUsb : kTypeESata;
    // The block holds the name references first; never read past it.
    const size_t available = static_cast<size_t>(blockSize) / sizeof(char *);
    const size_t listed = std::min(static_cast<size_t>(count), available);
    auto info = std::make_unique<ExtStgPartsVolInfo>();
    for (size_t i = 0; i < listed; ++i) {
        const char *device = nullptr;
        std::memcpy(&device, block.get() + i * sizeof(char *), sizeof device);
        if (device == nullptr)
            continue;
        std::memset(info.get(), 0, sizeof *info);
        if (KORVExtStgPartsVolInfoGet(device, info.get(), isUsb ? kInfoFlagUsb : kInfoFlagOther) < 0)
            continue;
        DiskName &name = names[device];
        name.displayName = korvread::FieldText(info->displayName, sizeof info->displayName);
        name.type = type;
    }
    return true;
}

// ---- Records ------------------------------------------------------------------

// Reads the device name of element `index` into `device`; false, logged, for
// an element that the collector cannot have meant.
bool ReadDevice(const Json::Value &element, Json::ArrayIndex index, std::string &device)
{
    if (!korvread::IsRecord(element)) {
        KORVSNMP_LOG(LOG_ERR, "DiskIO element %u is not an object", index);
        return false;
    }
    if (!korvread::ReadDeviceName(element, device)) {
        KORVSNMP_LOG(LOG_ERR, "DiskIO element %u: \"device\" is not a string", index);
        return false;
    }
    return true;
}

// `Records` is const Json::Value (the records are copied) or Json::Value
// (they are moved out).
template <typename Records>
bool FillIn(Records &diskIO, Json::Value &out)
{
    if (!diskIO.isArray())
        return false;
    if (!korvread::IsRecord(out)) {
        KORVSNMP_LOG(LOG_ERR, "disk output is not an object");
        return false;
    }

    DiskNameMap names;
    if (KLIBCIsQuillbox() == 0 && !EnumInternalDiskNames(names))
        return false;
    if (!KORVExternalDevEnum(names, EXTERNAL_USB_DEVICE) ||
        !KORVExternalDevEnum(names, EXTERNAL_ESATA_DEVICE))
        return false;

    Json::Value disks(Json::arrayValue);
    std::uint64_t sums[kCounterCount] = {};
    for (Json::ArrayIndex index = 0; index < diskIO.size(); ++index) {
        Records &element = diskIO[index];
        std::string device;
        if (!ReadDevice(element, index, device))
            return false;
        auto found = names.find(device);
        if (found == names.end() || found->second.displayName.empty())
            continue;

        Json::Value record = korvsnmp::Take(element);
        record["display_name"] = found->second.displayName;
        record["type"] = found->second.type;
        for (size_t counter = 0; counter < kCounterCount; ++counter) {
            unsigned int value = 0;
            if (!korvread::ReadUInt32(record[kCounterNames[counter]], value)) {
                KORVSNMP_LOG(LOG_ERR,
                             "DiskIO device [%s]: \"%s\" is not an unsigned 32-bit number",
                             device.c_str(), kCounterNames[counter]);
                return false;
            }
            sums[counter] += value;
        }
        disks.append(std::move(record));
    }

    Json::Value total(Json::objectValue);
    total["device"] = kTotalDevice;
    for (size_t counter = 0; counter < kCounterCount; ++counter) {
        std::uint64_t value = sums[counter];
        if (counter == kUtilizationCounter)
            value = disks.empty() ? 0 : value / disks.size();
        total[kCounterNames[counter]] = Json::Value(static_cast<Json::UInt64>(value));
    }
    out["total"] = std::move(total);
    out["disk"] = std::move(disks);
    return true;
}

}  // namespace

namespace KORVSNMP {

bool FillInCurrentDiskIO(const Json::Value &diskIO, Json::Value &out) { return FillIn(diskIO, out); }

bool FillInCurrentDiskIO(Json::Value &&diskIO, Json::Value &out) { return FillIn(diskIO, out); }

}  // namespace KORVSNMP
