#include "fuzz/QVFuzzFileSeeds.h"

#include "tests/unit/tally/QVTestMMV.h"

std::vector<QVFuzzFileSeed> QVFuzzMMVSeeds() {
  const QVTestMMV types{.metrics = {{"i32", {1}, kSigned32},
                                    {"u32", {2}, kUnsigned32},
                                    {"i64", {3}, kSigned64},
                                    {"u64", {4}, kUnsigned64},
                                    {"float", {QVTestCell(0.5F)}, kFloat},
                                    {"double", {QVTestCell(0.5)}, kDouble},
                                    {"text", {0}, kText},
                                    {"elapsed", {7}, kElapsed}},
                        .texts = 2};
  const QVTestMMV grouped{.subgroups = {"left", "right"},
                          .metrics = {{"frames", {1, 2}, kUnsigned64, true},
                                      {"underruns", {3, 4}, kSigned32, true},
                                      {"opens", {5}}}};
  const QVTestMMV sentinel{
      .metrics = {{"none", {UINT64_MAX}}, {"nan", {QVTestCell(-1)}, kFloat}, {"", {1}}},
      .flags = 6};
  return {
      {"types", types.bytes(), {1, 7}},
      {"grouped", grouped.bytes(), {1, 5}},
      {"sentinel", sentinel.bytes(), {1, 3}},
      {"no-channels", QVTestMMV{.subgroups = {"left"}}.bytes(), {1, 0}},
      {"nothing", QVTestMMV{}.bytes(), {1, 0}},
      {"unfinished", QVTestMMV{.generation = 0}.bytes(), {0, 0}},
      {"version-2", QVTestMMV{.version = 2}.bytes(), {0, 0}},
  };
}

std::vector<QVFuzzFileSeed> QVFuzzKernelTextSeeds() {
  return {
      {"sound-card",
       "state: RUNNING\nowner_pid   : 77\ntrigger_time: 12.345\n-----\nhw_ptr      : 4096\n",
       {2, 5}},
      {"statistics", "pgfault 12\ncpu  1 2 3\nctxt 99999999999999999999\nbtime -5", {4, 4}},
      {"memory", "MemTotal:       16384 kB\nHugePages_Total:\t0\nShmem:1\n\n", {3, 4}},
      {"times", "frames 12 at 10:30\nqueue 12 depth: 5\nRing 0: 5 \n", {3, 3}},
      {"none", "a: 0x10\nb: 1.5\nc: 12kB\n: 5\nd\n", {0, 5}},
  };
}

std::vector<QVFuzzFileSeed> QVFuzzJSONFileSeeds() {
  return {
      {"channels",
       R"([{"group": "Speaker", "subgroup": "pcm0p", "file": "/f", "channels": {"a": "b"}}])",
       {1, 7}},
      {"preferences",
       "{\n  \"device_name\": \"kitchen\",\n  \"disable_reporting\": false,\n  \"rate\": 44100.0,\n"
       "  \"list\": [null, true, -1, 18446744073709551615, 1e-300, 0.1]\n}\n",
       {1, 11}},
      {"texts", R"(["\u0000\u00e4\ud83c\udfb5\n\"\\\/\b\f\r\t", "ä", ""])", {1, 4}},
      {"deep", std::string(64, '[') + std::string(64, ']'), {1, 64}},
      {"too-deep", std::string(65, '[') + std::string(65, ']'), {0, 0}},
      {"twice", R"({"a": 1, "a": {"a": 2}})", {1, 3}},
      {"wrong", "{\"a\": oops}", {0, 0}},
  };
}

std::vector<QVFuzzFileSeed> QVFuzzJSONScanSeeds() {
  return {
      {"summary",
       R"([{"category": 3, "payload": {"frames": 480, "level": -3.5, "route": "speaker"}},)"
       "\n"
       R"({"category": 9, "payload": {"list": [null, true, 1e300]}}])",
       {1, 14}},
      {"texts", R"(["\u0000\u00e4\ud83c\udfb5\n\"\\\/\b\f\r\t", "ä", ""])", {1, 4}},
      {"deep", std::string(64, '[') + std::string(64, ']'), {1, 64}},
      {"too-deep", std::string(65, '[') + std::string(65, ']'), {0, 0}},
      {"empty", "[]", {1, 1}},
      {"no-array", "{}", {0, 0}},
      {"two", "[] []", {0, 0}},
      {"nul", std::string("[1]\0", 4), {0, 0}},
  };
}
