// The row indexes of KORVSNMP-MIB's tables: one number per device that stays
// with the device from sample to sample and, through a file in the front
// end's state directory, from one run to the next, as managers expect of
// ifIndex. Shared by every SNMP front end.
#ifndef KORVAGENTX_ROW_INDEXES_H
#define KORVAGENTX_ROW_INDEXES_H

#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <vector>

namespace korvagentx {

// One table's indexes, keyed by the device's identity (a disk's kernel name,
// "<kind>:<name>" for an interface, a volume's device, a LUN's UUID).
//
// How indexes are given: a device keeps the index it got when it first
// appeared, also while it is absent and after it comes back, as long as it is
// remembered. A new device gets the number after the last one given (1 for
// the first; after 4294967295 the count starts again at 1 and skips every
// number still held), so an index never names another device while the
// first one is remembered. A table remembers every device of the latest
// sample and up to kRemembered absent ones; beyond that the absent device
// seen longest ago is forgotten, and comes back, if ever, with a new index.
class RowIndexes {
public:
    static constexpr size_t kRemembered = 4096;
    // Longer identities are cut: two devices whose first bytes agree are one device.
    static constexpr size_t kIdentitySize = 1024;

    // The index of each row of one sample, in order. An identity that occurs
    // more than once in a sample gives one row each time: the device's key
    // is the identity, 0x1F and the number of earlier occurrences, so every
    // row gets an index of its own.
    std::vector<uint32_t> Assign(const std::vector<std::string> &identities);

    // Whether an Assign gave or forgot an index since the last call; clears it.
    bool TakeChanged();

    // The remembered devices, seen longest ago first: their keys (the
    // identity, 0x1F and the occurrence), indexes, and the next number.
    struct Row {
        std::string key;
        uint32_t index;
    };
    std::vector<Row> Rows() const;
    uint32_t Next() const { return next_; }
    // Replaces the state by `rows` (in the order of Rows()) and `next`.
    // False, leaving the table empty, when a key or an index occurs twice,
    // an index or `next` is 0, or there are more than kRemembered +
    // kMaxPresent rows.
    bool Restore(const std::vector<Row> &rows, uint32_t next);

    // The most rows a restored table may hold.
    static constexpr size_t kMaxPresent = 65536;

private:
    struct Slot {
        uint32_t index;
        uint64_t seen;  // the sample that last had it
    };
    uint32_t NewIndex();

    std::map<std::string, Slot> slots_;
    std::map<uint32_t, std::string> held_;  // index -> key
    uint32_t next_ = 1;
    uint64_t samples_ = 0;
    bool changed_ = false;
};

// The indexes of the four tables.
struct TableIndexes {
    RowIndexes disk, interface, volume, lun;
};

// The file that keeps a front end's TableIndexes between runs, in its state
// directory.
inline constexpr char kIndexFileName[] = "row-indexes";

// Keeps TableIndexes in the file at `path`.
class IndexFile {
public:
    static constexpr size_t kMaxFileSize = 32u << 20;

    explicit IndexFile(std::string path) : path_(std::move(path)) {}

    // Reads the file into `indexes`. No file (a first start) leaves them
    // empty, silently; a file that cannot be read, is larger than
    // kMaxFileSize or is not what Save writes is logged once and leaves
    // them empty (the next Save replaces it). False in those cases.
    bool Load(TableIndexes &indexes);

    // Writes `indexes` when an Assign changed them since the last Save:
    // into a new file beside it, synced, then renamed over it, so that a
    // crash leaves the old or the new file. A failure is logged once until a
    // write succeeds again; the next Save tries again. False on failure.
    bool Save(TableIndexes &indexes);

    const std::string &Path() const { return path_; }

private:
    std::string path_;
    bool dirty_ = false;    // a change not yet written
    bool failing_ = false;  // the last write failed and was logged
};

// The file's text for `indexes`, and the indexes of a text (false: not of
// that form; `indexes` then empty). Exposed for tests.
std::string IndexText(const TableIndexes &indexes);
bool ParseIndexText(const std::string &text, TableIndexes &indexes, std::string &whyNot);

}  // namespace korvagentx

#endif
