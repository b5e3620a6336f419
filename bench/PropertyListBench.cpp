// What reading and writing a todo list costs, beside a bare parse of the same XML.
//
// Other readers can be measured on the same bytes: the benchmarks of sizes 1000 and 10000 work on
// the list that APPSYNC_BENCH_PLIST names (a file in either encoding), if it is set, instead of
// their own; and when APPSYNC_BENCH_PLIST_OUT names a directory, the lists are left there as
// todo-<entries>.binary.plist and todo-<entries>.xml.plist before anything is measured.
//
// Names: BM_BinaryRead/N BM_BinaryWrite/N BM_XmlRead/N BM_XmlWrite/N BM_BareXmlParse/N.
// "bytes_per_second" counts the encoded size, so BM_XmlRead over BM_BareXmlParse is the ratio of
// speeds.

#include <benchmark/benchmark.h>

#include <cstdlib>
#include <fstream>
#include <iterator>
#include <pugixml.hpp>
#include <string>

#include "system/AllocatorTuning.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {
namespace {

PropertyList todoEntry(int number) {
    const std::string id = std::to_string(number);
    return PropertyList::map({
        {"identifier", "com.example.vendor" + std::to_string(number % 40) + ".application" + id},
        {"name", number % 10 == 0 ? "Übung & Spaß " + id : "Application " + id},
        {"version", std::to_string(number % 9) + "." + std::to_string(number % 100) + ".3"},
        {"operation", number % 5 == 0 ? "remove" : "install"},
        {"size", 1'000'000 + number * 4099},
        {"isUpdate", number % 3 == 0},
        {"purchaseDate", PropertyList::Date{7.0e8 + number * 61.0}},
        {"storeAccountID", std::int64_t{9'000'000'000} + number % 7},
        {"categories", PropertyList::array({"Productivity", "Utilities"})},
    });
}

PropertyList ownList(std::int64_t count) {
    PropertyList list = PropertyList::array(count);
    for (int i = 0; i < count; ++i) list.append(todoEntry(i));
    return list;
}

Bytes readFile(const char* path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

void writeFile(const std::string& path, const Bytes& bytes) {
    std::ofstream file(path, std::ios::binary);
    file.write(reinterpret_cast<const char*>(bytes.data()),
               static_cast<std::streamsize>(bytes.size()));
}

Bytes encoded(const PropertyList& list, PropertyListFormat format) {
    return *SystemPropertyLists().serialize(list, format);
}

/// The list to measure with, left in a file as well if somebody asked.
PropertyList todoList(const benchmark::State& state) {
    tuneAllocator();  // as the command does
    if (const char* path = std::getenv("APPSYNC_BENCH_PLIST")) {
        return *SystemPropertyLists().parse(readFile(path));
    }
    PropertyList list = ownList(state.range(0));
    if (const char* folder = std::getenv("APPSYNC_BENCH_PLIST_OUT")) {
        const std::string stem = std::string(folder) + "/todo-" + std::to_string(state.range(0));
        writeFile(stem + ".binary.plist", encoded(list, PropertyListFormat::Binary));
        writeFile(stem + ".xml.plist", encoded(list, PropertyListFormat::Xml));
    }
    return list;
}

void countBytes(benchmark::State& state, const Bytes& bytes) {
    state.SetBytesProcessed(static_cast<std::int64_t>(bytes.size()) * state.iterations());
}

void read(benchmark::State& state, PropertyListFormat format) {
    const Bytes bytes = encoded(todoList(state), format);
    SystemPropertyLists codec;
    for (auto _ : state) {
        auto result = codec.parse(bytes);
        if (!result) state.SkipWithError("not read");
        benchmark::DoNotOptimize(result);
    }
    countBytes(state, bytes);
}

void write(benchmark::State& state, PropertyListFormat format) {
    const PropertyList list = todoList(state);
    SystemPropertyLists codec;
    for (auto _ : state) {
        auto result = codec.serialize(list, format);
        if (!result) state.SkipWithError("not written");
        benchmark::DoNotOptimize(result);
    }
    countBytes(state, encoded(list, format));
}

void BM_BinaryRead(benchmark::State& state) { read(state, PropertyListFormat::Binary); }
void BM_BinaryWrite(benchmark::State& state) { write(state, PropertyListFormat::Binary); }
void BM_XmlRead(benchmark::State& state) { read(state, PropertyListFormat::Xml); }
void BM_XmlWrite(benchmark::State& state) { write(state, PropertyListFormat::Xml); }

void BM_BareXmlParse(benchmark::State& state) {
    const Bytes bytes = encoded(todoList(state), PropertyListFormat::Xml);
    for (auto _ : state) {
        pugi::xml_document document;
        if (!document.load_buffer(bytes.data(), bytes.size())) state.SkipWithError("not parsed");
        benchmark::DoNotOptimize(document.document_element());
    }
    countBytes(state, bytes);
}

BENCHMARK(BM_BinaryRead)->Arg(1000)->Arg(10000);
BENCHMARK(BM_BinaryWrite)->Arg(1000)->Arg(10000);
BENCHMARK(BM_XmlRead)->Arg(1000)->Arg(10000);
BENCHMARK(BM_XmlWrite)->Arg(1000)->Arg(10000);
BENCHMARK(BM_BareXmlParse)->Arg(1000)->Arg(10000);

}  // namespace
}  // namespace appsync
