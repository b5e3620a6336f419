#include <benchmark/benchmark.h>

#include <stdexcept>
#include <utility>

#include "device/screen/IconCanvas.h"
#include "device/screen/IconDrawing.h"
#include "system/AllocatorTuning.h"

// What the icon of a placeholder costs, beside the decoding of the file that it is made from.

namespace appsync {
namespace {

Bytes iconFile() {
    tuneAllocator();  // as the command does
    Result<Bytes> png = renderDefaultIcon("com.example.bench", "Bench");
    if (!png) throw std::runtime_error(png.error().description());
    return std::move(*png);
}

void renderIcon120(benchmark::State& state) {
    const Bytes png = iconFile();
    for ([[maybe_unused]] auto _ : state) {
        const Result<Bytes> icon = renderIcon(png);
        if (!icon) state.SkipWithError("not rendered");
        benchmark::DoNotOptimize(icon);
    }
}
BENCHMARK(renderIcon120);

void decodeIcon120(benchmark::State& state) {
    const Bytes png = iconFile();
    for ([[maybe_unused]] auto _ : state) {
        const Result<Surface> image = decodePng(png);
        if (!image) state.SkipWithError("not decoded");
        benchmark::DoNotOptimize(image);
    }
}
BENCHMARK(decodeIcon120);

}  // namespace
}  // namespace appsync
