#include "live_host.h"

#include <sys/sysinfo.h>

#include <algorithm>
#include <cctype>
#include <filesystem>
#include <fstream>
#include <set>
#include <sstream>

#include "protocol/lio_target.h"

namespace korvstandin::live {
namespace {

namespace fs = std::filesystem;

constexpr unsigned int kBytesPerKiB = 1024;
constexpr char kDevicePrefix[] = "/dev/";
constexpr char kPppPrefix[] = "ppp";
constexpr char kLoopback[] = "lo";
constexpr char kRootVolumeName[] = "root";
constexpr char kVolumeSection[] = "volume";
constexpr size_t kVlanConfigHeaderLines = 2;

// What the project ships for hosts without the web interface's strings file.
const std::map<std::string, std::string> kShippedVolumeTexts = {
    {"volume_disk", "Disk"},
    {"volume_expansion", "Expansion Unit"},
    {"dedicated_ssd_cache", "SSD Cache"},
};

std::string Trim(const std::string &text)
{
    const char *blanks = " \t\r\n";
    size_t first = text.find_first_not_of(blanks);
    if (first == std::string::npos)
        return "";
    return text.substr(first, text.find_last_not_of(blanks) - first + 1);
}

bool ReadFile(const fs::path &path, std::string &text)
{
    std::ifstream in(path);
    if (!in)
        return false;
    std::ostringstream content;
    content << in.rdbuf();
    text = content.str();
    return true;
}

std::string ReadTrimmed(const fs::path &path)
{
    std::string text;
    return ReadFile(path, text) ? Trim(text) : "";
}

// Entry names of a directory, sorted; none when it cannot be read.
std::vector<std::string> ListDirectory(const fs::path &directory)
{
    std::vector<std::string> names;
    std::error_code error;
    for (fs::directory_iterator it(directory, error), end; !error && it != end; it.increment(error))
        names.push_back(it->path().filename().string());
    std::sort(names.begin(), names.end());
    return names;
}

// sda, sdb, ..., sdz, sdaa: shorter names first, so that numbering is stable
// and reads naturally.
bool DiskOrder(const std::string &a, const std::string &b)
{
    return a.size() != b.size() ? a.size() < b.size() : a < b;
}

bool OnUsbBus(const fs::path &blockEntry)
{
    std::error_code error;
    fs::path device = fs::canonical(blockEntry, error);
    return !error && device.string().find("/usb") != std::string::npos;
}

// Mount points escape blanks and a few other bytes as \ooo.
std::string UnescapeMountField(const std::string &field)
{
    std::string text;
    for (size_t i = 0; i < field.size(); ++i) {
        if (field[i] == '\\' && i + 3 < field.size() && std::isdigit(static_cast<unsigned char>(field[i + 1])) &&
            std::isdigit(static_cast<unsigned char>(field[i + 2])) && std::isdigit(static_cast<unsigned char>(field[i + 3]))) {
            text += static_cast<char>(std::stoi(field.substr(i + 1, 3), nullptr, 8));
            i += 3;
        } else {
            text += field[i];
        }
    }
    return text;
}

}  // namespace

unsigned int ProbeMemory()
{
    struct sysinfo info {};
    if (sysinfo(&info) != 0)
        return 0;
    unsigned long long kib =
        static_cast<unsigned long long>(info.totalram) * info.mem_unit / kBytesPerKiB;
    return static_cast<unsigned int>(std::min<unsigned long long>(kib, ~0u));
}

void ProbeDisks(const std::string &root, HostDescription &host)
{
    const fs::path blocks = fs::path(root + "/sys/block");
    std::vector<std::string> names = ListDirectory(blocks);
    std::sort(names.begin(), names.end(), DiskOrder);
    int number = 0;
    for (const std::string &name : names) {
        const fs::path entry = blocks / name;
        std::error_code error;
        if (!fs::exists(entry / "device", error))  // loop, ram, dm, md: no hardware behind
            continue;
        if (OnUsbBus(entry)) {
            std::string text = Trim(ReadTrimmed(entry / "device/vendor") + " " +
                                    ReadTrimmed(entry / "device/model"));
            host.usb.devices.push_back({name, text.empty() ? name : text});
            continue;
        }
        Disk disk;
        disk.number = ++number;
        disk.container = DISK_CONTAINER_INTERNAL;
        disk.devicePath = kDevicePrefix + name;
        host.disks.push_back(disk);
    }
}

std::optional<ExternalDevice> ProbeExternalDevice(const std::string &root, const std::string &name,
                                                  bool usb)
{
    const fs::path entry = fs::path(root + "/sys/block") / name;
    std::error_code error;
    if (name.empty() || name.find('/') != std::string::npos || !fs::exists(entry / "device", error) ||
        OnUsbBus(entry) != usb)
        return std::nullopt;
    std::string text =
        Trim(ReadTrimmed(entry / "device/vendor") + " " + ReadTrimmed(entry / "device/model"));
    return ExternalDevice{name, text.empty() ? name : text};
}

std::vector<std::string> ProbeInterfaceNames(const std::string &root)
{
    std::vector<std::string> names = ListDirectory(root + "/sys/class/net");
    names.erase(std::remove(names.begin(), names.end(), kLoopback), names.end());
    return names;
}

std::optional<NetInterface> ProbeInterface(const std::string &root, const std::string &name)
{
    const fs::path directory = fs::path(root + "/sys/class/net") / name;
    std::error_code error;
    if (name.empty() || name == "." || name == ".." || name.find('/') != std::string::npos ||
        !fs::exists(directory, error))
        return std::nullopt;
    NetInterface entry;
    entry.name = name;

    std::string config;
    if (ReadFile(root + "/proc/net/vlan/config", config)) {
        std::istringstream lines(config);
        std::string line;
        for (size_t n = 0; std::getline(lines, line); ++n) {
            size_t first = line.find('|'), last = line.rfind('|');
            if (n < kVlanConfigHeaderLines || first == std::string::npos || first == last ||
                Trim(line.substr(0, first)) != name)
                continue;
            entry.role = NetRole::Vlan;
            entry.vlanParent = Trim(line.substr(last + 1));
            entry.vlanName = name;
            return entry;
        }
    }
    std::string slaves;
    if (ReadFile(directory / "bonding/slaves", slaves)) {
        entry.role = NetRole::Aggregation;
        std::istringstream members(slaves);
        for (std::string member; members >> member;)
            entry.members.push_back(member);
    }
    return entry;
}

std::string ProbePppLink(const std::string &root)
{
    for (const std::string &name : ListDirectory(root + "/sys/class/net"))
        if (name.rfind(kPppPrefix, 0) == 0)
            return name;
    return "";
}

void ProbeSpaces(const std::string &root, HostDescription &host)
{
    std::string mounts;
    if (!ReadFile(root + "/proc/self/mounts", mounts))
        return;
    std::set<std::string> seen;
    std::istringstream lines(mounts);
    std::string line;
    while (std::getline(lines, line)) {
        std::istringstream fields(line);
        std::string device, mountPoint;
        if (!(fields >> device >> mountPoint) || device.rfind(kDevicePrefix, 0) != 0 ||
            !seen.insert(device).second)
            continue;
        mountPoint = UnescapeMountField(mountPoint);
        std::string name = mountPoint == "/" ? kRootVolumeName : mountPoint.substr(1);
        host.spaces.push_back({device, name});
    }
}

void ProbeLuns(const std::string &root, HostDescription &host)
{
    const fs::path core = fs::path(root + "/sys") / korvproto::kLioCoreDirectory;
    for (const std::string &hba : ListDirectory(core)) {
        for (const std::string &backstore : ListDirectory(core / hba)) {
            std::string serial;
            if (!ReadFile(core / hba / backstore / korvproto::kLioUnitSerialFile, serial))
                continue;
            std::string uuid = korvproto::LunUuidOfUnitSerial(serial);
            if (!uuid.empty())
                host.luns.push_back({Json::Value(uuid), Json::Value(backstore)});
        }
    }
}

void ProbeStrings(const std::string &root, HostDescription &host)
{
    std::string text;
    if (ReadFile(root + kStringsFilePath, text))
        host.files[kStringsFilePath] = ParseSectionedFile(text);
    else
        host.files[kStringsFilePath] = {{kVolumeSection, kShippedVolumeTexts}};
}

SectionedFile ParseSectionedFile(const std::string &text)
{
    SectionedFile file;
    std::string section;
    std::istringstream lines(text);
    std::string line;
    while (std::getline(lines, line)) {
        line = Trim(line);
        if (line.empty() || line[0] == '#' || line[0] == ';')
            continue;
        if (line.front() == '[' && line.back() == ']') {
            section = Trim(line.substr(1, line.size() - 2));
            continue;
        }
        size_t equals = line.find('=');
        if (equals == std::string::npos)
            continue;
        std::string value = Trim(line.substr(equals + 1));
        if (value.size() >= 2 && value.front() == '"' && value.back() == '"')
            value = value.substr(1, value.size() - 2);
        file[section][Trim(line.substr(0, equals))] = value;
    }
    return file;
}

}  // namespace korvstandin::live
