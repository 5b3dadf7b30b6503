// The host platform's core library: model queries, the platform's string
// lists and string hashes, sectioned text files, its last-error record and
// the physical memory size.
//
// Declarations only: on the appliance the host's own library defines these;
// elsewhere the stand-in libkorvplatform.so.1 does.
#ifndef KORV_PLATFORM_CORE_H
#define KORV_PLATFORM_CORE_H

#ifdef __cplusplus
extern "C" {
#endif

// Nonzero on a Quillbox model, which names only external disks.
int KLIBCIsQuillbox(void);

// Physical memory size of the host; 0 when the platform has no figure.
unsigned int KLIBSystemPhysMemSizeGet(void);

// A list of NUL-terminated texts, owned by whoever handed it out.
typedef struct KLIBCSzList KLIBCSzList;

// Index (0 or more) of the first entry equal to `text`; negative when the
// list does not hold it or an argument is null.
int KLIBCSzListFind(const KLIBCSzList *list, const char *text);

// A hash from text key to text value.
typedef struct KLIBCSzHash KLIBCSzHash;

// A new empty hash sized for about `size` entries; null when out of memory.
KLIBCSzHash *KLIBCSzHashAlloc(int size);

// Stores a copy of `value` under `key` in the hash that `*hash` holds (the
// hash may be replaced by a larger one, hence the reference). Negative on
// failure, with the platform's last error set.
int KLIBCSzHashSetValue(KLIBCSzHash **hash, const char *key, const char *value);

// The text stored under `key`, owned by the hash; null when there is none.
const char *KLIBCSzHashGetValue(const KLIBCSzHash *hash, const char *key);

// Releases a hash; a null hash is allowed and does nothing.
void KLIBCSzHashFree(KLIBCSzHash *hash);

// Reads the value of `key` in `section` of the sectioned text file at
// `path` into `buffer` (at most `size` bytes, NUL-terminated, cut to fit).
// Negative when the file, the section or the key cannot be read.
int KLIBCFileGetSectionValue(const char *path, const char *section,
                             const char *key, char *buffer, int size);

// The platform's last error: its code, and the source file and line where
// the platform raised it.
unsigned int KLIBCErrGet(void);
const char *KLIBCErrorGetFile(void);
int KLIBCErrorGetLine(void);

#ifdef __cplusplus
}
#endif

#endif
