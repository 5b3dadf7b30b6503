// The host platform's disk, expansion-unit and USB services.
//
// Declarations only: on the appliance the host's own libraries define these;
// elsewhere the stand-in libkorvplatform.so.1 does.
#ifndef KORV_PLATFORM_DISK_H
#define KORV_PLATFORM_DISK_H

#include <stddef.h>

#include "korv_core.h"

#ifdef __cplusplus
extern "C" {
#endif

// Where a disk sits; a bit set.
enum {
    DISK_CONTAINER_INTERNAL = 0x01,   // an internal bay
    DISK_CONTAINER_EBOX = 0x02,       // an expansion unit
    DISK_CONTAINER_SSD_CACHE = 0x20,  // a dedicated SSD-cache device
};

#define DISK_DEVICE_PATH_SIZE 64

typedef struct DiskInfo {
    int diskNumber;   // the number users see
    int container;    // DISK_CONTAINER_*
    int groupIndex;   // SSD-cache devices: the slot group
    char devicePath[DISK_DEVICE_PATH_SIZE];  // normally "/dev/" and the device name
} DiskInfo;

// Which disks DiskInfoEnum lists.
typedef struct DiskFilter {
    int containerMask;  // disks whose container shares a bit with it
} DiskFilter;

// A singly linked disk list; released by its head.
typedef struct DiskInfoList {
    DiskInfo *disk;  // may be null
    struct DiskInfoList *next;
} DiskInfoList;

// Lists the disks that `filter` selects into `*head` (null when none).
// Negative on failure.
int DiskInfoEnum(const DiskFilter *filter, DiskInfoList **head);
void DiskInfoEnumFree(DiskInfoList *head);

// Nonzero when the model can carry expansion units.
int SupportEBox(void);

#define EBOX_MODEL_NAME_SIZE 64

// The unit's own identity data, read through its model-name operation.
typedef struct EBoxIdentity {
    char modelName[EBOX_MODEL_NAME_SIZE];
    char serial[32];
} EBoxIdentity;

typedef const char *(*EBoxModelNameFn)(const EBoxIdentity *identity);

// One expansion unit; units are linked through `next`.
typedef struct EBoxInfo {
    unsigned int unitNumber;
    KLIBCSzList *diskPaths;     // device paths of the disks in the unit
    EBoxModelNameFn modelName;  // may be null: the unit names no model
    EBoxIdentity identity;
    struct EBoxInfo *next;
} EBoxInfo;

// Lists the expansion units into `*head` (null when none). Negative on
// failure; a failing call may still leave a list in `*head`.
int KORVEBoxInfoEnum(EBoxInfo **head);
void KORVEBoxInfoEnumFree(EBoxInfo *head);

// Nonzero when the unit is powered on.
int KORVEBoxIsPoweron(const EBoxInfo *unit);

// External device kinds.
enum {
    EXTERNAL_USB_DEVICE = 2,
    EXTERNAL_ESATA_DEVICE = 16,
};

// Two-call form. With `names` null and `size` 0, stores into `*needed` the
// byte size that the list of devices of `kind` takes. With a zero-filled
// block of that size, fills it with an array of references to NUL-terminated
// device names (the names themselves live in the same block) and returns
// their number. Negative on failure in both forms.
int KORVUSBDevEnum(int kind, char **names, int size, int *needed);

#define EXT_STG_DISPLAY_NAME_SIZE 256

// External-storage information of one device (279,076 bytes: too large for
// a small thread stack).
typedef struct ExtStgPartsVolInfo {
    int kind;
    int partitionCount;
    unsigned char vendorData[24];
    char displayName[EXT_STG_DISPLAY_NAME_SIZE];  // NUL-terminated
    unsigned char partitions[278788];
} ExtStgPartsVolInfo;

#ifdef __cplusplus
static_assert(sizeof(ExtStgPartsVolInfo) == 279076, "information record is 279,076 bytes");
static_assert(offsetof(ExtStgPartsVolInfo, displayName) == 32, "display text at offset 32");
#endif

// Fills `info` for device `name`; `isUsb` is 1 for USB devices, else 0.
// Negative on failure.
int KORVExtStgPartsVolInfoGet(const char *name, ExtStgPartsVolInfo *info, int isUsb);

#ifdef __cplusplus
}
#endif

#endif
