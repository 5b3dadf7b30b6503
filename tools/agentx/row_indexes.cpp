// Row indexes that stay with their devices, and the file that keeps them.
#include "row_indexes.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <sstream>

#include "protocol/unique_fd.h"
#include "protocol/unit_log.h"

namespace korvagentx {

namespace {

constexpr char kLogUnit[] = "row_indexes";
constexpr char kHeader[] = "korvsnmp row indexes 1";
constexpr char kKeySeparator = '\x1f';
constexpr char kHex[] = "0123456789ABCDEF";
constexpr uint32_t kLastIndex = 0xFFFFFFFFu;
constexpr mode_t kDirectoryMode = 0755;

struct Table {
    const char *name;
    RowIndexes TableIndexes::*member;
};
constexpr Table kTables[] = {{"disk", &TableIndexes::disk},
                             {"interface", &TableIndexes::interface},
                             {"volume", &TableIndexes::volume},
                             {"lun", &TableIndexes::lun}};

// A key as one word: bytes outside '!'..'~' and '%' as %XX.
std::string Escape(const std::string &key)
{
    std::string word;
    for (unsigned char byte : key) {
        if (byte > ' ' && byte <= '~' && byte != '%') {
            word += static_cast<char>(byte);
        } else {
            word += '%';
            word += kHex[byte >> 4];
            word += kHex[byte & 0xF];
        }
    }
    return word;
}

int HexDigit(char c)
{
    const char *at = std::strchr(kHex, c);
    return c != '\0' && at != nullptr ? static_cast<int>(at - kHex) : -1;
}

bool Unescape(const std::string &word, std::string &key)
{
    key.clear();
    for (size_t i = 0; i < word.size(); ++i) {
        if (word[i] != '%') {
            key += word[i];
            continue;
        }
        if (i + 2 >= word.size())
            return false;
        const int high = HexDigit(word[i + 1]), low = HexDigit(word[i + 2]);
        if (high < 0 || low < 0)
            return false;
        key += static_cast<char>(high * 16 + low);
        i += 2;
    }
    return true;
}

// A decimal number from 1 to 4294967295 without sign or leading zero.
bool ParseIndex(const std::string &word, uint32_t &index)
{
    if (word.empty() || word.size() > 10 || word[0] == '0' ||
        word.find_first_not_of("0123456789") != std::string::npos)
        return false;
    const unsigned long long value = std::stoull(word);
    if (value > kLastIndex)
        return false;
    index = static_cast<uint32_t>(value);
    return true;
}

bool WriteAll(int fd, const std::string &text)
{
    for (size_t done = 0; done < text.size();) {
        const ssize_t n = write(fd, text.data() + done, text.size() - done);
        if (n < 0 && errno == EINTR)
            continue;
        if (n <= 0)
            return false;
        done += static_cast<size_t>(n);
    }
    return true;
}

}  // namespace

std::vector<uint32_t> RowIndexes::Assign(const std::vector<std::string> &identities)
{
    ++samples_;
    std::map<std::string, unsigned> occurrences;
    std::vector<uint32_t> indexes;
    indexes.reserve(identities.size());
    for (const std::string &identity : identities) {
        std::string key = identity.substr(0, kIdentitySize);
        key += kKeySeparator + std::to_string(occurrences[key]++);
        auto found = slots_.find(key);
        if (found == slots_.end()) {
            const uint32_t index = NewIndex();
            held_[index] = key;
            found = slots_.emplace(std::move(key), Slot{index, 0}).first;
            changed_ = true;
        }
        found->second.seen = samples_;
        indexes.push_back(found->second.index);
    }
    // Forget the absent devices seen longest ago beyond the bound.
    const size_t present = indexes.size();
    if (slots_.size() > present + kRemembered) {
        std::vector<std::map<std::string, Slot>::iterator> absent;
        for (auto slot = slots_.begin(); slot != slots_.end(); ++slot)
            if (slot->second.seen != samples_)
                absent.push_back(slot);
        std::sort(absent.begin(), absent.end(),
                  [](const auto &a, const auto &b) { return a->second.seen < b->second.seen; });
        const size_t excess = slots_.size() - present - kRemembered;
        for (size_t i = 0; i < excess; ++i) {
            held_.erase(absent[i]->second.index);
            slots_.erase(absent[i]);
        }
        changed_ = true;
    }
    return indexes;
}

uint32_t RowIndexes::NewIndex()
{
    // At most slots_.size() numbers are held, far fewer than 2^32 - 1.
    while (held_.count(next_) != 0)
        next_ = next_ == kLastIndex ? 1 : next_ + 1;
    const uint32_t index = next_;
    next_ = next_ == kLastIndex ? 1 : next_ + 1;
    return index;
}

bool RowIndexes::TakeChanged()
{
    return std::exchange(changed_, false);
}

std::vector<RowIndexes::Row> RowIndexes::Rows() const
{
    std::vector<std::pair<uint64_t, Row>> bySeen;
    for (const auto &[key, slot] : slots_)
        bySeen.push_back({slot.seen, {key, slot.index}});
    std::stable_sort(bySeen.begin(), bySeen.end(),
                     [](const auto &a, const auto &b) { return a.first < b.first; });
    std::vector<Row> rows;
    for (auto &[seen, row] : bySeen)
        rows.push_back(std::move(row));
    return rows;
}

bool RowIndexes::Restore(const std::vector<Row> &rows, uint32_t next)
{
    *this = RowIndexes();
    if (next == 0 || rows.size() > kRemembered + kMaxPresent)
        return false;
    for (const Row &row : rows) {
        if (row.index == 0 || !slots_.emplace(row.key, Slot{row.index, samples_++}).second ||
            !held_.emplace(row.index, row.key).second) {
            *this = RowIndexes();
            return false;
        }
    }
    next_ = next;
    return true;
}

std::string IndexText(const TableIndexes &indexes)
{
    std::string text = std::string(kHeader) + "\n";
    for (const Table &table : kTables) {
        const RowIndexes &rows = indexes.*table.member;
        text += std::string(table.name) + " next " + std::to_string(rows.Next()) + "\n";
        for (const RowIndexes::Row &row : rows.Rows())
            text += std::string(table.name) + " " + std::to_string(row.index) + " " + Escape(row.key) + "\n";
    }
    return text;
}

bool ParseIndexText(const std::string &text, TableIndexes &indexes, std::string &whyNot)
{
    indexes = TableIndexes();
    std::istringstream lines(text);
    std::string line;
    if (!std::getline(lines, line) || line != kHeader) {
        whyNot = "no header";
        return false;
    }
    std::map<std::string, std::pair<std::vector<RowIndexes::Row>, uint32_t>> read;
    for (size_t number = 2; std::getline(lines, line); ++number) {
        std::istringstream words(line);
        std::string name, first, word;
        words >> name >> first >> word;
        const bool known = std::any_of(std::begin(kTables), std::end(kTables),
                                       [&](const Table &table) { return name == table.name; });
        auto &[rows, next] = read[name];
        uint32_t index = 0;
        std::string key;
        bool fine = known && line == name + " " + first + " " + word;
        if (fine && first == "next")
            fine = next == 0 && ParseIndex(word, next);
        else if (fine)
            fine = ParseIndex(first, index) && Unescape(word, key) &&
                   rows.size() < RowIndexes::kRemembered + RowIndexes::kMaxPresent;
        if (!fine) {
            whyNot = "line " + std::to_string(number) + " is not a row";
            indexes = TableIndexes();
            return false;
        }
        if (first != "next")
            rows.push_back({std::move(key), index});
    }
    for (const Table &table : kTables) {
        const auto &[rows, next] = read[table.name];
        if (!(indexes.*table.member).Restore(rows, next)) {
            whyNot = std::string("the ") + table.name + " rows repeat a key or an index, or lack a next";
            indexes = TableIndexes();
            return false;
        }
    }
    return true;
}

bool IndexFile::Load(TableIndexes &indexes)
{
    indexes = TableIndexes();
    korvproto::UniqueFd fd(open(path_.c_str(), O_RDONLY | O_CLOEXEC));
    if (!fd.Valid() && errno == ENOENT)
        return false;
    struct stat status {};
    std::string why;
    if (!fd.Valid() || fstat(fd.Get(), &status) != 0) {
        why = std::strerror(errno);
    } else if (!S_ISREG(status.st_mode) || static_cast<uint64_t>(status.st_size) > kMaxFileSize) {
        why = "not a regular file of at most " + std::to_string(kMaxFileSize) + " bytes";
    } else {
        std::string text(static_cast<size_t>(status.st_size), '\0');
        size_t done = 0;
        for (ssize_t n; done < text.size() && (n = read(fd.Get(), &text[done], text.size() - done)) != 0;) {
            if (n < 0 && errno == EINTR)
                continue;
            if (n < 0)
                break;
            done += static_cast<size_t>(n);
        }
        text.resize(done);
        if (ParseIndexText(text, indexes, why))
            return true;
    }
    KORVSNMP_LOG(LOG_WARNING, "Cannot use the row indexes in %s (%s); numbering the rows anew", path_.c_str(),
                 why.c_str());
    dirty_ = true;
    return false;
}

bool IndexFile::Save(TableIndexes &indexes)
{
    for (const Table &table : kTables)
        dirty_ = (indexes.*table.member).TakeChanged() || dirty_;
    if (!dirty_)
        return true;
    const std::string temporary = path_ + ".new";
    const std::string text = IndexText(indexes);
    const size_t slash = path_.rfind('/');
    const std::string directory = slash == std::string::npos ? "." : slash == 0 ? "/" : path_.substr(0, slash);
    mkdir(directory.c_str(), kDirectoryMode);  // a state directory that systemd did not make
    bool written = false;
    {
        korvproto::UniqueFd fd(open(temporary.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644));
        written = fd.Valid() && WriteAll(fd.Get(), text) && fsync(fd.Get()) == 0;
        if (fd.Valid() && close(fd.Release()) != 0)
            written = false;
    }
    written = written && rename(temporary.c_str(), path_.c_str()) == 0;
    if (!written) {
        const int error = errno;
        unlink(temporary.c_str());
        if (!failing_)
            KORVSNMP_LOG(LOG_ERR, "Cannot write the row indexes to %s: %s", path_.c_str(), std::strerror(error));
        failing_ = true;
        return false;
    }
    // The rename itself is durable once the directory is synced.
    korvproto::UniqueFd dir(open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (dir.Valid())
        fsync(dir.Get());
    if (failing_)
        KORVSNMP_LOG(LOG_NOTICE, "The row indexes are written to %s again", path_.c_str());
    failing_ = false;
    dirty_ = false;
    return true;
}

}  // namespace korvagentx
