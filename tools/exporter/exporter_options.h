// The command line of korvsnmp-exporter.
#ifndef KORVSNMP_EXPORTER_OPTIONS_H
#define KORVSNMP_EXPORTER_OPTIONS_H

#include <cstdint>
#include <string>
#include <vector>

namespace korvexporter {

// The port given to korvsnmp-exporter in the range of Prometheus exporters.
inline constexpr uint16_t kDefaultPort = 9747;

enum class Action { Serve, Help, Version };

struct Options {
    Action action = Action::Serve;
    std::string listen = "127.0.0.1:" + std::to_string(kDefaultPort);  // civetweb's listening_ports
    uint32_t intervalSeconds = 5;
};

// Parses argv[1..]. False with `error` saying what is wrong on an unknown or
// repeated option, a bad value or a stray operand.
bool ParseOptions(const std::vector<std::string> &arguments, Options &options, std::string &error);

extern const char kUsage[];

}  // namespace korvexporter

#endif
