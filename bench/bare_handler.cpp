// The floor of the benchmark bench/snmp_speed.py: a bare net-snmp handler
// that answers as many Gauge32 objects as the large appliance has (under
// KORVSNMP-MIB's arc, in rows of eight columns) from a sorted array, with
// nothing else. Built twice: as an AgentX subagent (bare_agentx SOCKET) and
// as a module that snmpd loads (dlmod barekorv .../bare-snmpd.so).
// KORVBENCH_OBJECTS sets the number of objects (4320).
#include <net-snmp/net-snmp-config.h>
#include <net-snmp/net-snmp-includes.h>
#include <net-snmp/agent/net-snmp-agent-includes.h>

#include <signal.h>

#include <algorithm>
#include <cstdlib>
#include <vector>

namespace {

constexpr oid kArc[] = {1, 3, 6, 1, 3, 7947, 1, 10, 1};
constexpr size_t kNameLength = std::size(kArc) + 2;  // column, row
constexpr unsigned kColumns = 8;
constexpr unsigned kDefaultObjects = 4320;

std::vector<oid> names;  // kNameLength sub-identifiers per object, ascending
size_t objects = 0;
netsnmp_handler_registration *registration = nullptr;

const oid *NameOf(size_t index) { return names.data() + index * kNameLength; }

// The first object whose name is greater than (next) or not less than (exact) `name`.
size_t Search(const oid *name, size_t length, bool next)
{
    size_t low = 0;
    size_t high = objects;
    while (low < high) {
        const size_t middle = (low + high) / 2;
        const int order = snmp_oid_compare(NameOf(middle), kNameLength, name, length);
        if (order < 0 || (next && order == 0))
            low = middle + 1;
        else
            high = middle;
    }
    return low;
}

int Handle(netsnmp_mib_handler *, netsnmp_handler_registration *, netsnmp_agent_request_info *info,
           netsnmp_request_info *requests)
{
    for (netsnmp_request_info *request = requests; request != nullptr; request = request->next) {
        netsnmp_variable_list *variable = request->requestvb;
        const bool next = info->mode == MODE_GETNEXT;
        const size_t found = Search(variable->name, variable->name_length, next);
        if (found == objects ||
            (!next && snmp_oid_compare(NameOf(found), kNameLength, variable->name,
                                       variable->name_length) != 0)) {
            if (!next)
                netsnmp_set_request_error(info, request, SNMP_NOSUCHINSTANCE);
            continue;
        }
        if (next)
            snmp_set_var_objid(variable, NameOf(found), kNameLength);
        const u_long value = found * 7;
        snmp_set_var_typed_value(variable, ASN_GAUGE, &value, sizeof value);
    }
    return SNMP_ERR_NOERROR;
}

void Register()
{
    const char *count = std::getenv("KORVBENCH_OBJECTS");
    objects = count != nullptr ? std::strtoul(count, nullptr, 10) : kDefaultObjects;
    names.clear();
    for (unsigned column = 2; column < 2 + kColumns; ++column)
        for (size_t row = 1; row <= (objects + kColumns - 1) / kColumns; ++row) {
            if (names.size() / kNameLength == objects)
                break;
            names.insert(names.end(), std::begin(kArc), std::end(kArc));
            names.push_back(column);
            names.push_back(row);
        }
    registration = netsnmp_create_handler_registration("barekorv", Handle, kArc, std::size(kArc),
                                                       HANDLER_CAN_RONLY);
    netsnmp_register_handler(registration);
}

}  // namespace

#ifdef KORVBENCH_MODULE

extern "C" __attribute__((visibility("default"))) void init_barekorv(void) { Register(); }

extern "C" __attribute__((visibility("default"))) void deinit_barekorv(void)
{
    netsnmp_unregister_handler(registration);
}

#else

namespace {
volatile sig_atomic_t stopping = 0;
void Stop(int) { stopping = 1; }
}  // namespace

int main(int argc, char **argv)
{
    if (argc != 2)
        return 2;
    netsnmp_ds_set_boolean(NETSNMP_DS_APPLICATION_ID, NETSNMP_DS_AGENT_ROLE, 1);
    netsnmp_ds_set_string(NETSNMP_DS_APPLICATION_ID, NETSNMP_DS_AGENT_X_SOCKET, argv[1]);
    netsnmp_ds_set_boolean(NETSNMP_DS_LIBRARY_ID, NETSNMP_DS_LIB_DONT_READ_CONFIGS, 1);
    snmp_disable_log();
    init_agent("bare_agentx");
    Register();
    init_snmp("bare_agentx");
    signal(SIGTERM, Stop);
    while (!stopping)
        agent_check_and_process(1);
    snmp_shutdown("bare_agentx");
    return 0;
}

#endif
