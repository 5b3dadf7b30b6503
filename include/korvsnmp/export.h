// Marks what libkorvsnmp.so.1 exports; everything else stays hidden.
#ifndef KORVSNMP_EXPORT_H
#define KORVSNMP_EXPORT_H

#define KORVSNMP_EXPORT __attribute__((visibility("default")))

#endif
