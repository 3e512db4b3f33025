// A deterministic generator of host configuration documents for benchmarks
// and property tests: the sample host's keys replicated to scale, a host
// document filled with values that their schemas allow, and a desired document that differs
// from it in a controlled way.
//
// Not thread-safe (it writes files and changes nothing else).
#pragma once

#include <cstdint>
#include <string>

#include <hoxcm/json.h>

namespace hoxcm_bench {

struct GeneratorOptions {
  std::uint64_t seed = 1;
  // Copies of the sample host's keys: component C becomes C, C_1, C_2, ...
  int replicas = 1;
  // Instances of every multi-instance key.
  int instances = 10;
  // Share of leaf properties changed in the desired document.
  double changeRate = 0.01;
  // Share of instances added to, and of instances removed from, the desired
  // document (of every multi-instance key).
  double instanceChurn = 0.005;
  // Share of keys present on one side only (half each way; keys with a
  // default configuration are never one-sided).
  double oneSidedKeys = 0.01;
  // Share of multi-instance keys whose host instances are shuffled.
  double shuffledKeys = 0.2;
  // Keys of the desired document, spread evenly, given one invalid value
  // each (one schema finding each): real documents are valid, or nearly.
  int faults = 0;
};

// Writes the sample host's schemas, replicated `replicas` times, into the
// schema directory of the current root (HOX_ROOT).
void InstallReplicatedSchemas(int replicas);

// Fills `host` and `desired` as described above. Every value satisfies its
// key's schema (patterns, enumerations, bounds, lengths, formats), so both
// documents validate, except for the `faults` planted in `desired`. With changeRate,
// instanceChurn, oneSidedKeys and shuffledKeys all 0, desired equals host.
void GeneratePair(const GeneratorOptions& options, rapidjson::Document& host, rapidjson::Document& desired);

// One multi-instance key ("storage/nfs/mounts", replica 0) holding `count`
// instances; the desired document holds them in host order or, with
// `shuffled`, the host holds them in a random order.
void GenerateWideKey(std::uint64_t seed, int count, bool shuffled, rapidjson::Document& host,
                     rapidjson::Document& desired);

}  // namespace hoxcm_bench
