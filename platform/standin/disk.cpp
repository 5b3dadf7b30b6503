// Stand-in for the disk, expansion-unit and USB services.
//
// DiskInfoEnum hands out every described disk, whatever the filter's mask:
// the description says what the enumeration answers, and the mask is only
// journalled.
#include <cstddef>
#include <cstring>
#include <new>

#include "live_host.h"
#include "standin_state.h"

using korvstandin::ExternalDeviceSet;
using korvstandin::Fault;
using korvstandin::detail::Current;
using korvstandin::detail::Domain;
using korvstandin::Op;
using korvstandin::detail::CopyText;
using korvstandin::detail::Enter;
using korvstandin::detail::Guarded;
using korvstandin::detail::Text;

namespace {

void FreeDiskList(DiskInfoList *head)
{
    while (head != nullptr) {
        DiskInfoList *next = head->next;
        delete head->disk;
        delete head;
        head = next;
    }
}

DiskInfoList *BuildDiskList()
{
    DiskInfoList *head = nullptr;
    DiskInfoList **tail = &head;
    try {
        for (const korvstandin::Disk &disk : Current(Domain::Disks).disks) {
            *tail = new DiskInfoList{};
            DiskInfoList *node = *tail;
            tail = &node->next;
            if (disk.recordMissing)
                continue;
            node->disk = new DiskInfo{};
            node->disk->diskNumber = disk.number;
            node->disk->container = disk.container;
            node->disk->groupIndex = disk.groupIndex;
            CopyText(node->disk->devicePath, sizeof node->disk->devicePath, disk.devicePath);
        }
    } catch (const std::bad_alloc &) {
        FreeDiskList(head);
        throw;
    }
    if (head != nullptr)
        korvstandin::detail::Allocated();
    return head;
}

const char *ModelNameOf(const EBoxIdentity *identity)
{
    return identity == nullptr ? nullptr : identity->modelName;
}

// The stand-in keeps a unit's power state beside its record, keyed by address.
struct StandinEBox {
    EBoxInfo info;
    bool poweredOn;
};
static_assert(offsetof(StandinEBox, info) == 0, "a unit record starts its stand-in node");

void FreeUnitList(EBoxInfo *head)
{
    while (head != nullptr) {
        EBoxInfo *next = head->next;
        korvstandin::detail::FreeSzList(head->diskPaths);
        delete reinterpret_cast<StandinEBox *>(head);
        head = next;
    }
}

EBoxInfo *BuildUnitList()
{
    EBoxInfo *head = nullptr;
    EBoxInfo **tail = &head;
    try {
        for (const korvstandin::ExpansionUnit &unit : Current(Domain::Disks).expansionUnits) {
            auto *node = new StandinEBox{};
            *tail = &node->info;
            tail = &node->info.next;
            node->info.unitNumber = unit.number;
            node->info.diskPaths = korvstandin::detail::NewSzList(unit.diskPaths);
            if (unit.modelName) {
                node->info.modelName = ModelNameOf;
                CopyText(node->info.identity.modelName, sizeof node->info.identity.modelName,
                         *unit.modelName);
            }
            node->poweredOn = unit.poweredOn;
        }
    } catch (const std::bad_alloc &) {
        FreeUnitList(head);
        throw;
    }
    if (head != nullptr)
        korvstandin::detail::Allocated();
    return head;
}

const ExternalDeviceSet *DeviceSetOf(int kind)
{
    switch (kind) {
    case EXTERNAL_USB_DEVICE:
        return &Current(Domain::Disks).usb;
    case EXTERNAL_ESATA_DEVICE:
        return &Current(Domain::Disks).esata;
    default:
        return nullptr;
    }
}

// The described device `name` of `kind`; on the live host, that one device alone.
std::optional<korvstandin::ExternalDevice> FindDevice(int kind, const char *name)
{
    if (!korvstandin::detail::Described())
        return korvstandin::live::ProbeExternalDevice("", name, kind == EXTERNAL_USB_DEVICE);
    for (const korvstandin::ExternalDevice &device : DeviceSetOf(kind)->devices)
        if (device.name == name)
            return device;
    return std::nullopt;
}

size_t DeviceListSize(const ExternalDeviceSet &set)
{
    size_t size = set.devices.size() * sizeof(char *);
    for (const korvstandin::ExternalDevice &device : set.devices)
        size += device.name.size() + 1;
    return size;
}

}  // namespace

extern "C" {

int DiskInfoEnum(const DiskFilter *filter, DiskInfoList **head)
{
    Fault fault = Enter(Op::DiskInfoEnum, filter ? filter->containerMask : -1);
    if (head == nullptr || fault == Fault::Fail)
        return -1;
    return Guarded(Op::DiskInfoEnum, -1, [&] {
        *head = BuildDiskList();
        return fault == Fault::None ? 0 : -1;
    });
}

void DiskInfoEnumFree(DiskInfoList *head)
{
    Enter(Op::DiskInfoEnumFree);
    if (head == nullptr)
        return;
    korvstandin::detail::Released();
    FreeDiskList(head);
}

int SupportEBox(void)
{
    if (Enter(Op::SupportEBox) != Fault::None)
        return 0;
    return Current(Domain::Model).supportsEBox ? 1 : 0;
}

int KORVEBoxInfoEnum(EBoxInfo **head)
{
    Fault fault = Enter(Op::KORVEBoxInfoEnum);
    if (head == nullptr || fault == Fault::Fail)
        return -1;
    return Guarded(Op::KORVEBoxInfoEnum, -1, [&] {
        *head = BuildUnitList();
        return fault == Fault::None ? 0 : -1;
    });
}

void KORVEBoxInfoEnumFree(EBoxInfo *head)
{
    Enter(Op::KORVEBoxInfoEnumFree);
    if (head == nullptr)
        return;
    korvstandin::detail::Released();
    FreeUnitList(head);
}

int KORVEBoxIsPoweron(const EBoxInfo *unit)
{
    if (Enter(Op::KORVEBoxIsPoweron, unit ? unit->unitNumber : 0u) != Fault::None ||
        unit == nullptr)
        return 0;
    return reinterpret_cast<const StandinEBox *>(unit)->poweredOn ? 1 : 0;
}

int KORVUSBDevEnum(int kind, char **names, int size, int *needed)
{
    if (Enter(Op::KORVUSBDevEnum, kind, names ? "buffer" : "(null)", size) != Fault::None)
        return -1;
    return Guarded(Op::KORVUSBDevEnum, -1, [&] {
        const ExternalDeviceSet *set = DeviceSetOf(kind);
        if (set == nullptr)
            return -1;
        size_t listSize = DeviceListSize(*set);
        if (names == nullptr) {
            if (set->sizeQueryFails || needed == nullptr)
                return -1;
            *needed = set->neededClaim.value_or(static_cast<int>(listSize));
            return 0;
        }
        if (set->fillFails || size < 0 || static_cast<size_t>(size) < listSize)
            return -1;
        char *text = reinterpret_cast<char *>(names + set->devices.size());
        for (size_t i = 0; i < set->devices.size(); ++i) {
            const std::string &name = set->devices[i].name;
            std::memcpy(text, name.c_str(), name.size() + 1);
            names[i] = text;
            text += name.size() + 1;
        }
        return set->countClaim.value_or(static_cast<int>(set->devices.size()));
    });
}

int KORVExtStgPartsVolInfoGet(const char *name, ExtStgPartsVolInfo *info, int isUsb)
{
    if (Enter(Op::KORVExtStgPartsVolInfoGet, Text(name), isUsb) != Fault::None ||
        name == nullptr || info == nullptr)
        return -1;
    const int kind = isUsb ? EXTERNAL_USB_DEVICE : EXTERNAL_ESATA_DEVICE;
    return Guarded(Op::KORVExtStgPartsVolInfoGet, -1, [&] {
        std::optional<korvstandin::ExternalDevice> device = FindDevice(kind, name);
        if (!device || device->infoFails)
            return -1;
        info->kind = kind;
        CopyText(info->displayName, sizeof info->displayName, device->displayText);
        return 0;
    });
}

}  // extern "C"
