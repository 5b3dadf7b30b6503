#include "host_file.h"

#include <climits>
#include <fstream>
#include <functional>
#include <memory>
#include <set>
#include <sstream>

#include <json/reader.h>
#include <json/writer.h>

namespace korvstandin {
namespace {

// Bounds of a description; the fixed-size fields are those of the records
// that the platform hands out.
constexpr Json::ArrayIndex kMaxDisks = 1024;
constexpr Json::ArrayIndex kMaxUnits = 64;
constexpr Json::ArrayIndex kMaxExternalDevices = 256;
constexpr Json::ArrayIndex kMaxInterfaces = 256;
constexpr Json::ArrayIndex kMaxSpaces = 1024;
constexpr Json::ArrayIndex kMaxLuns = 4096;
constexpr Json::ArrayIndex kMaxListItems = 1024;
constexpr Json::ArrayIndex kMaxSections = 64;
constexpr size_t kMaxText = 1023;
constexpr int kMaxNesting = 16;

constexpr char kContainerInternal[] = "internal";
constexpr char kContainerEbox[] = "ebox";
constexpr char kContainerSsdCache[] = "ssd_cache";

// A schema violation, at the member it names.
struct SchemaError {
    std::string member;
    std::string what;
};

// One JSON value and the member path that leads to it.
class Member {
public:
    Member(const Json::Value &value, std::string path) : value_(value), path_(std::move(path)) {}

    [[noreturn]] void Fail(const std::string &what) const { throw SchemaError{path_, what}; }

    const Json::Value &Value() const { return value_; }

    // An object whose members are all in `known`.
    const Member &Object(std::initializer_list<const char *> known) const
    {
        if (!value_.isObject())
            Fail("not an object");
        std::set<std::string> names(known.begin(), known.end());
        for (const std::string &name : value_.getMemberNames())
            if (names.count(name) == 0)
                Member(value_[name], Path(name)).Fail("unknown member");
        return *this;
    }

    bool Has(const char *name) const { return value_.isMember(name); }

    Member operator[](const char *name) const
    {
        if (!Has(name))
            Fail(std::string("member \"") + name + "\" missing");
        return Member(value_[name], Path(name));
    }

    // Visits each element of an array of at most `limit` elements.
    void Each(Json::ArrayIndex limit, const std::function<void(const Member &)> &visit) const
    {
        if (!value_.isArray())
            Fail("not an array");
        if (value_.size() > limit)
            Fail(std::to_string(value_.size()) + " elements, more than " + std::to_string(limit));
        for (Json::ArrayIndex i = 0; i < value_.size(); ++i)
            visit(Member(value_[i], path_ + "[" + std::to_string(i) + "]"));
    }

    // A text of at most `limit` characters, without NUL; empty only when allowed.
    std::string Text(size_t limit, bool nonEmpty = false) const
    {
        if (!value_.isString())
            Fail("not a string");
        std::string text = value_.asString();
        if (text.size() > limit)
            Fail("longer than " + std::to_string(limit) + " characters");
        if (nonEmpty && text.empty())
            Fail("empty");
        if (text.find('\0') != std::string::npos)
            Fail("holds a NUL character");
        return text;
    }

    int Int(long long low = INT_MIN, long long high = INT_MAX) const
    {
        if (!value_.isInt64() || value_.asInt64() < low || value_.asInt64() > high)
            Fail("not an integer from " + std::to_string(low) + " to " + std::to_string(high));
        return static_cast<int>(value_.asInt64());
    }

    unsigned int UInt() const
    {
        if (!value_.isUInt())
            Fail("not an unsigned 32-bit integer");
        return value_.asUInt();
    }

    bool Bool() const
    {
        if (!value_.isBool())
            Fail("not a boolean");
        return value_.asBool();
    }

    std::vector<std::string> Texts(Json::ArrayIndex limit, size_t textLimit) const
    {
        std::vector<std::string> texts;
        Each(limit, [&](const Member &item) { texts.push_back(item.Text(textLimit)); });
        return texts;
    }

private:
    std::string Path(const std::string &name) const { return path_.empty() ? name : path_ + "." + name; }

    const Json::Value &value_;
    std::string path_;
};

int Container(const Member &member)
{
    const std::string name = member.Text(kMaxText);
    if (name == kContainerInternal)
        return DISK_CONTAINER_INTERNAL;
    if (name == kContainerEbox)
        return DISK_CONTAINER_EBOX;
    if (name == kContainerSsdCache)
        return DISK_CONTAINER_SSD_CACHE;
    member.Fail("unknown container \"" + name + "\" (internal, ebox or ssd_cache)");
}

const std::pair<const char *, NetRole> kRoles[] = {
    {"plain", NetRole::Plain},
    {"vlan", NetRole::Vlan},
    {"aggregation", NetRole::Aggregation},
    {"ovs_master", NetRole::OvsMaster},
};

NetRole Role(const Member &member)
{
    const std::string name = member.Text(kMaxText);
    for (const auto &[text, role] : kRoles)
        if (name == text)
            return role;
    member.Fail("unknown role \"" + name + "\" (plain, vlan, aggregation or ovs_master)");
}

const char *RoleName(NetRole role)
{
    for (const auto &[text, known] : kRoles)
        if (known == role)
            return text;
    return "plain";
}

const char *ContainerName(int container)
{
    switch (container) {
    case DISK_CONTAINER_EBOX:
        return kContainerEbox;
    case DISK_CONTAINER_SSD_CACHE:
        return kContainerSsdCache;
    default:
        return kContainerInternal;
    }
}

// Longest text that a fixed field of `size` bytes holds with its NUL.
constexpr size_t Fits(size_t size) { return size - 1; }

void ReadDevices(const Member &list, ExternalDeviceSet &set)
{
    list.Each(kMaxExternalDevices, [&](const Member &item) {
        item.Object({"name", "display_text"});
        set.devices.push_back({item["name"].Text(kMaxText, true),
                               item["display_text"].Text(Fits(EXT_STG_DISPLAY_NAME_SIZE))});
    });
}

void ReadDescription(const Member &root, HostDescription &host)
{
    root.Object({"memory_size", "quillbox", "expansion_units_supported", "disks",
                 "expansion_units", "usb", "esata", "interfaces", "pppoe", "spaces",
                 "flash_caches", "luns", "strings"});
    host = HostDescription{};
    if (root.Has("memory_size"))
        host.physMemSize = root["memory_size"].UInt();
    if (root.Has("quillbox"))
        host.quillbox = root["quillbox"].Bool();
    if (root.Has("expansion_units_supported"))
        host.supportsEBox = root["expansion_units_supported"].Bool();
    if (root.Has("disks"))
        root["disks"].Each(kMaxDisks, [&](const Member &item) {
            item.Object({"number", "container", "group", "device_path"});
            Disk disk;
            disk.number = item["number"].Int();
            disk.container = Container(item["container"]);
            disk.groupIndex = item.Has("group") ? item["group"].Int() : 0;
            disk.devicePath = item["device_path"].Text(Fits(DISK_DEVICE_PATH_SIZE), true);
            host.disks.push_back(disk);
        });
    if (root.Has("expansion_units"))
        root["expansion_units"].Each(kMaxUnits, [&](const Member &item) {
            item.Object({"number", "disk_paths", "model", "powered_on"});
            ExpansionUnit unit;
            unit.number = item["number"].UInt();
            unit.diskPaths = item["disk_paths"].Texts(kMaxListItems, kMaxText);
            if (item.Has("model"))
                unit.modelName = item["model"].Text(Fits(EBOX_MODEL_NAME_SIZE));
            unit.poweredOn = item.Has("powered_on") ? item["powered_on"].Bool() : true;
            host.expansionUnits.push_back(unit);
        });
    if (root.Has("usb"))
        ReadDevices(root["usb"], host.usb);
    if (root.Has("esata"))
        ReadDevices(root["esata"], host.esata);
    if (root.Has("interfaces"))
        root["interfaces"].Each(kMaxInterfaces, [&](const Member &item) {
            item.Object({"name", "role", "vlan_parent", "vlan_name", "members"});
            NetInterface entry;
            entry.name = item["name"].Text(Fits(KLIB_NET_NAME_SIZE), true);
            entry.role = item.Has("role") ? Role(item["role"]) : NetRole::Plain;
            if (entry.role == NetRole::Vlan) {
                entry.vlanParent = item["vlan_parent"].Text(Fits(KLIB_NET_NAME_SIZE), true);
                entry.vlanName = item["vlan_name"].Text(Fits(KLIB_NET_NAME_SIZE));
            } else if (item.Has("vlan_parent") || item.Has("vlan_name")) {
                item.Fail("VLAN members on an interface whose role is not \"vlan\"");
            }
            if (entry.role == NetRole::Aggregation)
                entry.members =
                    item["members"].Texts(KLIB_NET_AGGR_MAX_MEMBERS, Fits(KLIB_NET_NAME_SIZE));
            else if (item.Has("members"))
                item.Fail("members on an interface whose role is not \"aggregation\"");
            host.interfaces.push_back(entry);
        });
    if (root.Has("pppoe"))
        host.pppoeInterface = root["pppoe"].Text(Fits(KLIB_NET_NAME_SIZE));
    if (root.Has("spaces"))
        root["spaces"].Each(kMaxSpaces, [&](const Member &item) {
            item.Object({"device_path", "name"});
            host.spaces.push_back({item["device_path"].Text(Fits(SPACE_DEVICE_PATH_SIZE), true),
                                   item["name"].Text(Fits(SPACE_NAME_SIZE))});
        });
    if (root.Has("flash_caches"))
        root["flash_caches"].Each(kMaxSpaces, [&](const Member &item) {
            item.Object({"space_path", "volume_path", "layer_path"});
            FlashCache cache;
            cache.spacePath = item["space_path"].Text(kMaxText);
            cache.volumePath = item["volume_path"].Text(kMaxText);
            cache.layerPath = item["layer_path"].Text(kMaxText);
            host.flashCaches.push_back(cache);
        });
    if (root.Has("luns"))
        root["luns"].Each(kMaxLuns, [&](const Member &item) {
            item.Object({"uuid", "name"});
            host.luns.push_back({Json::Value(item["uuid"].Text(kMaxText)),
                                 Json::Value(item["name"].Text(kMaxText))});
        });
    if (root.Has("strings")) {
        const Member strings = root["strings"];
        if (!strings.Value().isObject())
            strings.Fail("not an object");
        if (strings.Value().size() > kMaxSections)
            strings.Fail("more than " + std::to_string(kMaxSections) + " sections");
        SectionedFile &file = host.files[kStringsFilePath];
        for (const std::string &section : strings.Value().getMemberNames()) {
            const Member texts(strings.Value()[section], "strings." + section);
            if (!texts.Value().isObject())
                texts.Fail("not an object");
            if (texts.Value().size() > kMaxListItems)
                texts.Fail("more than " + std::to_string(kMaxListItems) + " texts");
            for (const std::string &key : texts.Value().getMemberNames())
                file[section][key] =
                    Member(texts.Value()[key], "strings." + section + "." + key).Text(kMaxText);
        }
    }
}

}  // namespace

bool ParseHostDescription(const std::string &text, HostDescription &host, std::string &error)
{
    Json::CharReaderBuilder builder;
    builder["collectComments"] = false;
    builder["allowComments"] = false;
    builder["strictRoot"] = true;
    builder["failIfExtra"] = true;
    builder["rejectDupKeys"] = true;
    builder["stackLimit"] = kMaxNesting;
    const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    Json::Value root;
    std::string errors;
    try {
        if (!reader->parse(text.data(), text.data() + text.size(), &root, &errors)) {
            error = "not JSON: " + errors.substr(0, errors.find('\n', errors.find('\n') + 1));
            while (!error.empty() && error.back() == '\n')
                error.pop_back();
            return false;
        }
        ReadDescription(Member(root, ""), host);
    } catch (const SchemaError &schema) {
        error = (schema.member.empty() ? std::string("top level") : schema.member) + ": " + schema.what;
        return false;
    } catch (const Json::Exception &exception) {
        error = std::string("not JSON: ") + exception.what();
        return false;
    } catch (const std::runtime_error &exception) {  // the reader's nesting limit
        error = std::string("not JSON: ") + exception.what();
        return false;
    }
    return true;
}

bool ReadHostFile(const std::string &path, HostDescription &host, std::string &error)
{
    std::ifstream in(path, std::ios::binary);
    if (!in) {
        error = "cannot be opened";
        return false;
    }
    std::string text(kHostFileMaxBytes + 1, '\0');
    in.read(&text[0], static_cast<std::streamsize>(text.size()));
    if (in.bad()) {
        error = "cannot be read";
        return false;
    }
    text.resize(static_cast<size_t>(in.gcount()));
    if (text.size() > kHostFileMaxBytes) {
        error = "larger than " + std::to_string(kHostFileMaxBytes) + " bytes";
        return false;
    }
    return ParseHostDescription(text, host, error);
}

std::string HostFileText(const HostDescription &host)
{
    Json::Value root(Json::objectValue);
    root["memory_size"] = host.physMemSize;
    root["quillbox"] = host.quillbox;
    root["expansion_units_supported"] = host.supportsEBox;
    Json::Value &disks = root["disks"] = Json::Value(Json::arrayValue);
    for (const Disk &disk : host.disks) {
        Json::Value &item = disks.append(Json::Value(Json::objectValue));
        item["number"] = disk.number;
        item["container"] = ContainerName(disk.container);
        if (disk.groupIndex != 0)
            item["group"] = disk.groupIndex;
        item["device_path"] = disk.devicePath;
    }
    Json::Value &units = root["expansion_units"] = Json::Value(Json::arrayValue);
    for (const ExpansionUnit &unit : host.expansionUnits) {
        Json::Value &item = units.append(Json::Value(Json::objectValue));
        item["number"] = unit.number;
        Json::Value &paths = item["disk_paths"] = Json::Value(Json::arrayValue);
        for (const std::string &path : unit.diskPaths)
            paths.append(path);
        if (unit.modelName)
            item["model"] = *unit.modelName;
        item["powered_on"] = unit.poweredOn;
    }
    for (const auto &[name, set] : {std::pair{"usb", &host.usb}, std::pair{"esata", &host.esata}}) {
        Json::Value &devices = root[name] = Json::Value(Json::arrayValue);
        for (const ExternalDevice &device : set->devices) {
            Json::Value &item = devices.append(Json::Value(Json::objectValue));
            item["name"] = device.name;
            item["display_text"] = device.displayText;
        }
    }
    Json::Value &interfaces = root["interfaces"] = Json::Value(Json::arrayValue);
    for (const NetInterface &entry : host.interfaces) {
        Json::Value &item = interfaces.append(Json::Value(Json::objectValue));
        item["name"] = entry.name;
        item["role"] = RoleName(entry.role);
        if (entry.role == NetRole::Vlan) {
            item["vlan_parent"] = entry.vlanParent;
            item["vlan_name"] = entry.vlanName;
        }
        if (entry.role == NetRole::Aggregation) {
            Json::Value &members = item["members"] = Json::Value(Json::arrayValue);
            for (const std::string &member : entry.members)
                members.append(member);
        }
    }
    if (!host.pppoeInterface.empty())
        root["pppoe"] = host.pppoeInterface;
    Json::Value &spaces = root["spaces"] = Json::Value(Json::arrayValue);
    for (const Space &space : host.spaces) {
        Json::Value &item = spaces.append(Json::Value(Json::objectValue));
        item["device_path"] = space.devicePath;
        item["name"] = space.name;
    }
    Json::Value &caches = root["flash_caches"] = Json::Value(Json::arrayValue);
    for (const FlashCache &cache : host.flashCaches) {
        Json::Value &item = caches.append(Json::Value(Json::objectValue));
        item["space_path"] = cache.spacePath.value_or("");
        item["volume_path"] = cache.volumePath.value_or("");
        item["layer_path"] = cache.layerPath;
    }
    Json::Value &luns = root["luns"] = Json::Value(Json::arrayValue);
    for (const Lun &lun : host.luns) {
        Json::Value &item = luns.append(Json::Value(Json::objectValue));
        item["uuid"] = lun.uuid;
        item["name"] = lun.name;
    }
    Json::Value &strings = root["strings"] = Json::Value(Json::objectValue);
    if (auto file = host.files.find(kStringsFilePath); file != host.files.end())
        for (const auto &[section, texts] : file->second)
            for (const auto &[key, value] : texts)
                strings[section][key] = value;
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "  ";
    return Json::writeString(builder, root) + "\n";
}

}  // namespace korvstandin
