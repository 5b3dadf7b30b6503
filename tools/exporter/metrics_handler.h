// How the exporter's HTTP server, civetweb under prometheus-cpp's Exposer,
// answers /metrics: with the snapshot's ready text, in the format that the
// scraper accepts, so that a scrape costs a copy, never a serialization.
#ifndef KORVSNMP_EXPORTER_METRICS_HANDLER_H
#define KORVSNMP_EXPORTER_METRICS_HANDLER_H

#include <CivetServer.h>

#include "exposition/exposition.h"
#include "snapshot_exporter.h"

namespace korvexporter {

inline constexpr char kMetricsPath[] = "/metrics";

// OpenMetrics when the Accept header (null: none) names
// application/openmetrics-text, else Prometheus's classic text format.
korvexposition::TextFormat FormatFor(const char *accept);

// The Content-Type of `format`'s text.
const char *ContentTypeOf(korvexposition::TextFormat format);

// Callbacks for prometheus::Exposer: GET and HEAD of kMetricsPath are
// answered from `exporter`, other methods there with 405; other paths are
// left to civetweb (404). One exporter a process: `exporter` must outlive
// the server.
CivetCallbacks MetricsCallbacks(const SnapshotExporter &exporter);

}  // namespace korvexporter

#endif
