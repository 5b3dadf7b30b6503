// Answers KORVSNMP-MIB's subtree from the latest snapshot.
#include "agentx_handler.h"

#include <net-snmp/net-snmp-config.h>
#include <net-snmp/net-snmp-includes.h>
#include <net-snmp/agent/net-snmp-agent-includes.h>

#include <syslog.h>

#include <algorithm>
#include <iterator>

#include "mib_layout.h"

namespace korvagentx {

namespace {

constexpr char kUnit[] = "agentx_handler";
constexpr char kRegistrationName[] = "korvsnmp";

const Sampler *theSampler = nullptr;
netsnmp_handler_registration *theRegistration = nullptr;

Oid ToOid(const oid *name, size_t length)
{
    return Oid(name, name + length);  // sub-identifiers are 32-bit on the wire
}

void SetValue(netsnmp_variable_list *variable, const Value &value, const Snapshot &snapshot,
              const Sampler &sampler)
{
    auto setUnsigned = [variable](u_char type, uint64_t number) {
        u_long narrow = static_cast<u_long>(std::min<uint64_t>(number, 0xFFFFFFFFull));
        snmp_set_var_typed_value(variable, type, &narrow, sizeof narrow);
    };
    switch (value.type) {
    case ValueType::Gauge32:
        setUnsigned(ASN_GAUGE, value.number);
        break;
    case ValueType::Counter32:
        setUnsigned(ASN_COUNTER, value.number);
        break;
    case ValueType::Unsigned32:
        setUnsigned(ASN_UNSIGNED, value.number);
        break;
    case ValueType::Integer: {
        long integer = static_cast<long>(value.number);
        snmp_set_var_typed_value(variable, ASN_INTEGER, &integer, sizeof integer);
        break;
    }
    case ValueType::Counter64: {
        counter64 wide{static_cast<u_long>(value.number >> 32),
                       static_cast<u_long>(value.number & 0xFFFFFFFFull)};
        snmp_set_var_typed_value(variable, ASN_COUNTER64, &wide, sizeof wide);
        break;
    }
    case ValueType::Text:
        snmp_set_var_typed_value(variable, ASN_OCTET_STR, value.text.data(), value.text.size());
        break;
    case ValueType::TimeStamp:
        setUnsigned(ASN_TIMETICKS, value.number);
        break;
    case ValueType::SnapshotAge: {
        auto age = std::chrono::duration_cast<std::chrono::seconds>(
            std::chrono::steady_clock::now() - snapshot.taken);
        setUnsigned(ASN_UNSIGNED, static_cast<uint64_t>(std::max<int64_t>(age.count(), 0)));
        break;
    }
    case ValueType::FailedSamples:
        setUnsigned(ASN_COUNTER, sampler.FailedSamples());
        break;
    }
}

int HandleRequests(netsnmp_mib_handler *, netsnmp_handler_registration *,
                   netsnmp_agent_request_info *info, netsnmp_request_info *requests)
{
    if (theSampler == nullptr)
        return SNMP_ERR_GENERR;
    const std::shared_ptr<const Snapshot> snapshot = theSampler->Current();
    for (netsnmp_request_info *request = requests; request != nullptr; request = request->next) {
        if (request->processed)
            continue;
        netsnmp_variable_list *variable = request->requestvb;
        const Oid asked = ToOid(variable->name, variable->name_length);
        switch (info->mode) {
        case MODE_GET:
            if (const Entry *entry = snapshot->Find(asked))
                SetValue(variable, entry->value, *snapshot, *theSampler);
            else
                netsnmp_set_request_error(info, request,
                                          IsInstanceOfKnownObject(asked) ? SNMP_NOSUCHINSTANCE
                                                                         : SNMP_NOSUCHOBJECT);
            break;
        case MODE_GETNEXT:
            if (const Entry *entry = snapshot->FindNext(asked)) {
                std::vector<oid> name(entry->oid.begin(), entry->oid.end());
                snmp_set_var_objid(variable, name.data(), name.size());
                SetValue(variable, entry->value, *snapshot, *theSampler);
            }
            // Past the last object: left unanswered, so the agent goes on
            // to the next subtree (endOfMibView at the end of the view).
            break;
        default:
            netsnmp_set_request_error(info, request, SNMP_ERR_NOTWRITABLE);
            break;
        }
    }
    return SNMP_ERR_NOERROR;
}

}  // namespace

bool RegisterSubtree(const Sampler &sampler)
{
    theSampler = &sampler;
    oid root[std::size(kKorvsnmpArc)];
    std::copy(std::begin(kKorvsnmpArc), std::end(kKorvsnmpArc), root);
    theRegistration = netsnmp_create_handler_registration(kRegistrationName, HandleRequests, root,
                                                          std::size(root), HANDLER_CAN_RONLY);
    if (theRegistration == nullptr || netsnmp_register_handler(theRegistration) != MIB_REGISTERED_OK) {
        syslog(LOG_ERR, "%s:%d Cannot register the korvsnmp subtree", kUnit, __LINE__);
        theRegistration = nullptr;  // netsnmp_register_handler frees it on failure
        return false;
    }
    return true;
}

void UnregisterSubtree()
{
    if (theRegistration != nullptr)
        netsnmp_unregister_handler(theRegistration);
    theRegistration = nullptr;
}

}  // namespace korvagentx
