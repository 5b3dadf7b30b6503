// Answers KORVSNMP-MIB's subtree from the latest snapshot, in the subagent
// and in snmpd alike.
#include "agentx_handler.h"

#include <net-snmp/net-snmp-config.h>
#include <net-snmp/net-snmp-includes.h>
#include <net-snmp/agent/net-snmp-agent-includes.h>

#include <syslog.h>

#include <algorithm>
#include <iterator>
#include <new>

#include "mib_layout.h"

namespace korvagentx {

namespace {

constexpr char kUnit[] = "agentx_handler";
constexpr char kRegistrationName[] = "korvsnmp";

const Sampler *theSampler = nullptr;
netsnmp_handler_registration *theRegistration = nullptr;

// A name that no object of the snapshot has: noSuchInstance when a column
// or scalar of the MIB names it, noSuchObject otherwise.
int MissReason(const oid *name, size_t length)
{
    const Oid asked(name, name + length);  // sub-identifiers are 32-bit on the wire
    return IsInstanceOfKnownObject(asked) ? SNMP_NOSUCHINSTANCE : SNMP_NOSUCHOBJECT;
}

void SetUnsigned(netsnmp_variable_list *variable, u_char type, uint64_t number)
{
    const u_long narrow = static_cast<u_long>(std::min<uint64_t>(number, 0xFFFFFFFFull));
    snmp_set_var_typed_value(variable, type, &narrow, sizeof narrow);
}

void SetValue(netsnmp_variable_list *variable, const EncodedObject &object,
              const EncodedSnapshot &snapshot, const Sampler &sampler)
{
    switch (object.kind) {
    case ValueType::Integer: {
        const long integer = static_cast<long>(object.number);
        snmp_set_var_typed_value(variable, object.type, &integer, sizeof integer);
        break;
    }
    case ValueType::Counter64: {
        const counter64 wide{static_cast<u_long>(object.number >> 32),
                             static_cast<u_long>(object.number & 0xFFFFFFFFull)};
        snmp_set_var_typed_value(variable, object.type, &wide, sizeof wide);
        break;
    }
    case ValueType::Text:
        snmp_set_var_typed_value(variable, object.type, snapshot.Text(object), object.textLength);
        break;
    case ValueType::SnapshotAge: {
        const auto age = std::chrono::duration_cast<std::chrono::seconds>(
            std::chrono::steady_clock::now() - snapshot.Taken());
        SetUnsigned(variable, object.type, static_cast<uint64_t>(std::max<int64_t>(age.count(), 0)));
        break;
    }
    case ValueType::FailedSamples:
        SetUnsigned(variable, object.type, sampler.FailedSamples());
        break;
    case ValueType::Gauge32:
    case ValueType::Counter32:
    case ValueType::Unsigned32:
    case ValueType::TimeStamp:
        SetUnsigned(variable, object.type, object.number);
        break;
    }
}

void Answer(netsnmp_agent_request_info *info, netsnmp_request_info *requests)
{
    const std::shared_ptr<const EncodedSnapshot> snapshot = theSampler->Current();
    for (netsnmp_request_info *request = requests; request != nullptr; request = request->next) {
        if (request->processed)
            continue;
        netsnmp_variable_list *variable = request->requestvb;
        switch (info->mode) {
        case MODE_GET:
            if (const EncodedObject *object = snapshot->Find(variable->name, variable->name_length))
                SetValue(variable, *object, *snapshot, *theSampler);
            else
                netsnmp_set_request_error(info, request,
                                          MissReason(variable->name, variable->name_length));
            break;
        case MODE_GETNEXT:
            if (const EncodedObject *object = snapshot->FindNext(variable->name, variable->name_length)) {
                snmp_set_var_objid(variable, snapshot->Name(*object), object->nameLength);
                SetValue(variable, *object, *snapshot, *theSampler);
            }
            // Past the last object: left unanswered, so the agent goes on
            // to the next subtree (endOfMibView at the end of the view).
            break;
        default:
            netsnmp_set_request_error(info, request, SNMP_ERR_NOTWRITABLE);
            break;
        }
    }
}

int HandleRequests(netsnmp_mib_handler *, netsnmp_handler_registration *,
                   netsnmp_agent_request_info *info, netsnmp_request_info *requests)
{
    if (theSampler == nullptr)
        return SNMP_ERR_GENERR;
    // No exception may cross net-snmp's C frames (in snmpd that would end snmpd).
    try {
        Answer(info, requests);
    } catch (const std::bad_alloc &) {
        syslog(LOG_ERR, "%s:%d Out of memory while answering", kUnit, __LINE__);
        return SNMP_ERR_GENERR;
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
