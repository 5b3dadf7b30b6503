// The host platform's storage services: storage spaces, flash caches and the
// layered block devices that caches form over spaces.
//
// Declarations only: on the appliance the host's own libraries define these;
// elsewhere the stand-in libkorvplatform.so.1 does.
#ifndef KORV_PLATFORM_STORAGE_H
#define KORV_PLATFORM_STORAGE_H

#ifdef __cplusplus
extern "C" {
#endif

#define SPACE_DEVICE_PATH_SIZE 256
#define SPACE_NAME_SIZE 2048

// One storage space; spaces are linked through `next`.
typedef struct SpaceInfo {
    char devicePath[SPACE_DEVICE_PATH_SIZE];  // the space's block-device node
    char name[SPACE_NAME_SIZE];               // the space's display name
    struct SpaceInfo *next;
} SpaceInfo;

// Lists the storage spaces into `*list` (null when none); `flags` is 1.
// Negative on failure; a failing call may still leave a list in `*list`.
int KORVSpaceInfoEnum(int flags, SpaceInfo **list);
void KORVSpaceInfoFree(SpaceInfo *list);

// One flash cache; caches are linked through `next`.
typedef struct FlashCacheConfig {
    char *spacePath;   // device path of the cached space
    char *volumePath;  // path of the cached volume
    struct FlashCacheConfig *next;
} FlashCacheConfig;

// Lists the flash caches into `*list`; `flags` is 0. Greater than 0 when a
// list was obtained; 0 or less when there is none or on failure (a failing
// call may still leave a list in `*list`).
int KORVFlashCacheConfigGet(int flags, FlashCacheConfig **list);
// Releases a flash-cache list; a null list is allowed.
void KORVFlashCacheConfigFree(FlashCacheConfig *list);

// Names the space beneath a flash cache.
typedef struct SpaceLayerRef {
    const char *volumePath;
    const char *spacePath;
} SpaceLayerRef;

// Writes into `buffer` (`size` bytes, NUL-terminated) the device-node path of
// the layered block device that the flash cache forms over the space that
// `ref` names; `flags` is 1. Negative on failure.
int KORVVSpaceLayerPathGet(int flags, const SpaceLayerRef *ref, char *buffer, int size);

#ifdef __cplusplus
}
#endif

#endif
