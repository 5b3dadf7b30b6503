// mibs/KORVSNMP-MIB.txt and the statistics catalogue describe the same
// objects: the same names, OIDs and SYNTAX, and each DESCRIPTION names the
// catalogue's unit. The MIB is read with smidump (smitools), whose Python
// form python3 turns into JSON.
#include <cstdio>
#include <memory>
#include <set>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "catalogue/statistics_catalogue.h"
#include "json_text.h"
#include "mib_layout.h"

namespace {

using korvcatalogue::Kind;
using korvcatalogue::Statistic;
using korvcatalogue::Syntax;

// smidump's Python text as JSON.
constexpr char kToJson[] =
    "python3 -c 'import json, sys; names = {}; exec(sys.stdin.read(), names); print(json.dumps(names[\"MIB\"]))'";

std::string RunCommand(const std::string &command)
{
    std::string output;
    std::unique_ptr<FILE, int (*)(FILE *)> pipe(popen(command.c_str(), "r"), pclose);
    char buffer[4096];
    for (size_t n; pipe && (n = fread(buffer, 1, sizeof buffer, pipe.get())) > 0;)
        output.append(buffer, n);
    return output;
}

Json::Value ReadMib(const std::string &path)
{
    return korvtest::ParseJson(RunCommand("SMIPATH=" KORVSNMP_MIB_DIRS " smidump -f python " + path +
                                          " 2>/dev/null | " + kToJson));
}

const char *SyntaxName(Syntax syntax)
{
    switch (syntax) {
    case Syntax::None: return "";
    case Syntax::SnmpAdminString: return "SnmpAdminString";
    case Syntax::Integer: return "Enumeration";
    case Syntax::Unsigned32: return "Unsigned32";
    case Syntax::Gauge32: return "Gauge32";
    case Syntax::Counter32: return "Counter32";
    case Syntax::CounterBasedGauge64: return "CounterBasedGauge64";
    case Syntax::Counter64: return "Counter64";
    case Syntax::TimeStamp: return "TimeStamp";
    }
    return "";
}

std::string CatalogueOid(const Statistic &statistic)
{
    std::string oid;
    for (uint32_t arc : korvagentx::kKorvsnmpArc)
        oid += std::to_string(arc) + ".";
    oid += std::to_string(korvagentx::kObjects) + "." +
           std::to_string(korvcatalogue::SnmpGroupOf(statistic.section)) + ".";
    const auto siblings = korvcatalogue::StatisticsOf(statistic.section);
    const bool table = std::any_of(siblings.begin(), siblings.end(),
                                   [](const Statistic *s) { return s->kind == Kind::Index; });
    return oid + (table ? "1." : "") + std::to_string(statistic.snmpNumber);
}

// `text` in lower case with each run of white space one space, as words compare.
std::string Words(const std::string &text)
{
    std::string words;
    for (unsigned char c : text)
        if (!std::isspace(c))
            words += static_cast<char>(std::tolower(c));
        else if (!words.empty() && words.back() != ' ')
            words += ' ';
    return words;
}

// What the MIB (smidump's "nodes") and the catalogue disagree on, one line each.
std::vector<std::string> Disagreements(const Json::Value &mib)
{
    std::vector<std::string> found;
    const Json::Value &nodes = mib["nodes"];
    std::set<std::string> objects;
    for (const std::string &name : nodes.getMemberNames()) {
        const std::string type = nodes[name]["nodetype"].asString();
        if (type == "scalar" || type == "column")
            objects.insert(name);
    }
    for (const Statistic &statistic : korvcatalogue::Statistics()) {
        const std::string &name = statistic.snmpObject;
        if (name.empty())
            continue;
        if (objects.erase(name) == 0) {
            found.push_back(name + ": in the catalogue, not in the MIB");
            continue;
        }
        const Json::Value &node = nodes[name];
        if (node["oid"].asString() != CatalogueOid(statistic))
            found.push_back(name + ": OID " + CatalogueOid(statistic) + " in the catalogue, " +
                            node["oid"].asString() + " in the MIB");
        const Json::Value &type = node["syntax"]["type"];
        const std::string syntax = type.isMember("name") ? type["name"].asString() : type["basetype"].asString();
        if (syntax != SyntaxName(statistic.syntax))
            found.push_back(name + ": SYNTAX " + SyntaxName(statistic.syntax) + " in the catalogue, " + syntax +
                            " in the MIB");
        const std::string unit = korvcatalogue::UnitWordOf(statistic.unit);
        if (Words(node["description"].asString()).find(Words(unit)) == std::string::npos)
            found.push_back(name + ": the DESCRIPTION does not say \"" + unit + "\"");
    }
    for (const std::string &name : objects)
        found.push_back(name + ": in the MIB, not in the catalogue");
    return found;
}

TEST(MibCatalogue, EveryObjectOfTheMibIsTheCataloguesAndTheyAgree)
{
    const Json::Value mib = ReadMib(KORVSNMP_SOURCE_DIR "/mibs/KORVSNMP-MIB.txt");
    ASSERT_EQ(mib["moduleName"].asString(), "KORVSNMP-MIB") << "smidump or python3 failed";
    EXPECT_THAT(Disagreements(mib), ::testing::IsEmpty());
}

TEST(MibCatalogue, AMibThatDisagreesIsCaught)
{
    const Json::Value mib = ReadMib(KORVSNMP_SOURCE_DIR "/tests/fixtures/KORVSNMP-MIB-mismatched.txt");
    ASSERT_EQ(mib["moduleName"].asString(), "KORVSNMP-MIB") << "smidump or python3 failed";
    std::vector<std::string> disagreements = Disagreements(mib);
    const auto absent = std::remove_if(disagreements.begin(), disagreements.end(), [](const std::string &line) {
        return line.find(": in the catalogue, not in the MIB") != std::string::npos &&
               line != "korvNfsCallsTotal: in the catalogue, not in the MIB";
    });
    size_t objects = 0;
    for (const Statistic &statistic : korvcatalogue::Statistics())
        objects += statistic.snmpObject.empty() ? 0 : 1;
    EXPECT_EQ(static_cast<size_t>(disagreements.end() - absent), objects - 5);  // the fixture has 5 of them
    disagreements.erase(absent, disagreements.end());
    EXPECT_THAT(disagreements, ::testing::ElementsAre(
        "korvCpuUser: SYNTAX Gauge32 in the catalogue, Counter32 in the MIB",
        "korvCpuNice: OID 1.3.6.1.3.7947.1.2.2 in the catalogue, 1.3.6.1.3.7947.1.2.20 in the MIB",
        "korvNfsReadByte: the DESCRIPTION does not say \"bytes per second\"",
        "korvNfsCallsTotal: in the catalogue, not in the MIB",
        "korvNfsCallTotal: in the MIB, not in the catalogue",
        "korvNfsDevice: in the MIB, not in the catalogue"));
}

}  // namespace
