// Property-list codec throughput on a 10,000-record todo list, in both formats.
#include <benchmark/benchmark.h>

#include <cstdio>
#include <string>

#include "runtime/plist/codec.h"

namespace appsync::plist {
namespace {

Value todoList() {
  Array records;
  records.reserve(10000);
  char number[8];
  for (int i = 0; i < 10000; ++i) {
    std::snprintf(number, sizeof number, "%05d", i);
    records.push_back(Dict{{"identifier", std::string("com.example.app") + number},
                           {"operation", "install"},
                           {"version", "1.2.3"},
                           {"name", std::string("App ") + number}});
  }
  return records;
}

void BM_PlistParseXml(benchmark::State& state) {
  const std::string xml = *writeXml(todoList());
  const std::span<const std::uint8_t> bytes(reinterpret_cast<const std::uint8_t*>(xml.data()),
                                            xml.size());
  for (auto _ : state) benchmark::DoNotOptimize(parse(bytes));
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * xml.size()));
}
BENCHMARK(BM_PlistParseXml)->Unit(benchmark::kMillisecond);

void BM_PlistParseBinary(benchmark::State& state) {
  const Bytes binary = *writeBinary(todoList());
  for (auto _ : state) benchmark::DoNotOptimize(parse(binary));
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * binary.size()));
}
BENCHMARK(BM_PlistParseBinary)->Unit(benchmark::kMillisecond);

void BM_PlistWriteXml(benchmark::State& state) {
  const Value list = todoList();
  for (auto _ : state) benchmark::DoNotOptimize(writeXml(list));
}
BENCHMARK(BM_PlistWriteXml)->Unit(benchmark::kMillisecond);

void BM_PlistWriteBinary(benchmark::State& state) {
  const Value list = todoList();
  for (auto _ : state) benchmark::DoNotOptimize(writeBinary(list));
}
BENCHMARK(BM_PlistWriteBinary)->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace appsync::plist
