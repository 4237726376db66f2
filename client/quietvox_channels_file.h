#pragma once

// The file that quietvox_channels.h makes: PCP's "memory mapped values" format, version 1, in the
// byte order of the machine. Header, table of contents, then the sections: with subgroups their
// domain and the subgroups as its instances; the channels as metrics; a value for each channel and
// subgroup. All elements are multiples of 8 bytes. C99 and C++.

#include <stddef.h>
#include <stdint.h>
#include <string.h>

// Bytes of a name, with the NUL that ends it.
#define QUIETVOX_CHANNELS_NAME_BYTES 64

typedef struct QuietVoxFileHeader {
  char magic[4];
  int32_t version;
  uint64_t generation;
  uint64_t generationAgain;  // equal to the other one once the file is whole
  int32_t sections;
  uint32_t flags;
  int32_t process;
  int32_t cluster;
} QuietVoxFileHeader;

typedef struct QuietVoxFileSection {
  int32_t kind;
  int32_t count;
  uint64_t offset;
} QuietVoxFileSection;

typedef struct QuietVoxFileDomain {
  uint32_t serial;
  uint32_t count;
  uint64_t firstInstance;
  uint64_t texts[2];
} QuietVoxFileDomain;

typedef struct QuietVoxFileInstance {
  uint64_t domain;
  uint32_t padding;
  int32_t number;
  char name[QUIETVOX_CHANNELS_NAME_BYTES];
} QuietVoxFileInstance;

typedef struct QuietVoxFileMetric {
  char name[QUIETVOX_CHANNELS_NAME_BYTES];
  uint32_t number;
  int32_t type;
  int32_t semantics;
  uint32_t unit;
  uint32_t domain;
  uint32_t padding;
  uint64_t texts[2];
} QuietVoxFileMetric;

typedef struct QuietVoxFileValue {
  uint64_t cell;
  int64_t extra;
  uint64_t metric;
  uint64_t instance;
} QuietVoxFileValue;

static inline void quietvox_file_list(QuietVoxFileHeader* header, int32_t kind, size_t count,
                                      const void* first) {
  QuietVoxFileSection* section = (QuietVoxFileSection*)(header + 1) + header->sections++;
  section->kind = kind;
  section->count = (int32_t)count;
  section->offset = (uint64_t)((const unsigned char*)first - (const unsigned char*)header);
}

// Fills a file of zeros but for the generations. Answers its values: those of the first channel
// for each subgroup, then those of the second, and so on.
static inline QuietVoxFileValue* quietvox_file_fill(QuietVoxFileHeader* header,
                                                    const char* const* subgroups, size_t groups,
                                                    const char* const* names, size_t channels) {
  unsigned char* const file = (unsigned char*)header;
  unsigned char* const sections = file + sizeof *header;
  QuietVoxFileDomain* const domain =
      (QuietVoxFileDomain*)(sections + (groups == 0 ? 2 : 4) * sizeof(QuietVoxFileSection));
  QuietVoxFileInstance* const instances = (QuietVoxFileInstance*)(domain + (groups == 0 ? 0 : 1));
  QuietVoxFileMetric* const metrics = (QuietVoxFileMetric*)(instances + groups);
  QuietVoxFileValue* const values = (QuietVoxFileValue*)(metrics + channels);
  const size_t rows = groups == 0 ? 1 : groups;
  memcpy(header->magic, "MMV", 4);
  header->version = 1;
  if (groups != 0) {
    domain->serial = 1;
    domain->count = (uint32_t)groups;
    domain->firstInstance = (uint64_t)((unsigned char*)instances - file);
    quietvox_file_list(header, 1, 1, domain);
    quietvox_file_list(header, 2, groups, instances);
  }
  quietvox_file_list(header, 3, channels, metrics);
  quietvox_file_list(header, 4, channels * rows, values);
  for (size_t i = 0; i < groups; ++i) {
    instances[i].domain = (uint64_t)((unsigned char*)domain - file);
    instances[i].number = (int32_t)i;
    memcpy(instances[i].name, subgroups[i], strlen(subgroups[i]));
  }
  for (size_t i = 0; i < channels * rows; ++i) {
    QuietVoxFileMetric* const metric = &metrics[i / rows];
    values[i].metric = (uint64_t)((unsigned char*)metric - file);
    if (groups != 0) values[i].instance = (uint64_t)((unsigned char*)&instances[i % rows] - file);
    if (i % rows != 0) continue;
    metric->number = (uint32_t)(i / rows + 1);
    metric->type = 3;                                // unsigned, 64 bits
    metric->semantics = 1;                           // a counter
    metric->unit = UINT32_C(1) << 20;                // of things that happened
    metric->domain = groups == 0 ? UINT32_MAX : 1U;  // its serial
    memcpy(metric->name, names[i / rows], strlen(names[i / rows]));
  }
  return values;
}
