// Muxing a 10-second 1080p H.264 clip in process, against the ffmpeg
// program copying the same Annex-B stream into a QuickTime file. Both write
// to the same temporary directory; the in-process path also splits nothing,
// since the frames already arrive one per call, as the host lends them.
#include <benchmark/benchmark.h>
#include <stdlib.h>
#include <unistd.h>

#include <cstdio>
#include <memory>
#include <string>

#include "alertmod/platform/testing/manual_env.h"
#include "alertmod/video/clip_writer.h"
#include "alertmod/video/testing/clip_media.h"

namespace {

const cliptest::MediaRecipe kRecipe{hx::kCodecH264, 1920, 1080, 250, 25};

struct BenchMedia {
  std::string directory;
  std::string stream;  // the raw Annex-B file
  std::vector<cliptest::MediaFrame> frames;
  std::unique_ptr<cliptest::HostClip> clip;

  BenchMedia() {
    char pattern[] = "/tmp/clip-mux-bench-XXXXXX";
    directory = mkdtemp(pattern) ? pattern : "/tmp";
    frames = cliptest::MakeFrames(kRecipe, directory);
    stream = directory + "/source.es";
    clip = std::make_unique<cliptest::HostClip>(kRecipe, frames, "HOSTHEADER", 1000, 40);
  }
  ~BenchMedia() { cliptest::RunCommand("rm -rf '" + directory + "'", nullptr); }
};

BenchMedia& Media() {
  static BenchMedia media;
  return media;
}

void BM_InProcessMux(benchmark::State& state) {
  BenchMedia& media = Media();
  if (media.frames.size() != kRecipe.frames) {
    state.SkipWithError("test media could not be made with ffmpeg");
    return;
  }
  const std::string path = media.directory + "/in_process.mov";
  for (auto _ : state) {
    const bool written = hx::WriteVideoAttachment(1, media.clip->Stream(), path, nullptr,
                                                  *hx::platform::SystemEnvForTests());
    benchmark::DoNotOptimize(written);
  }
  // Without the codec libraries the writer still returns true, having
  // written nothing: such a run measures nothing.
  if (cliptest::ReadBytes(path).empty()) state.SkipWithError("no clip was written");
  state.counters["frames"] = static_cast<double>(media.frames.size());
}
BENCHMARK(BM_InProcessMux)->Unit(benchmark::kMillisecond);

void BM_FfmpegCopyBaseline(benchmark::State& state) {
  BenchMedia& media = Media();
  if (media.frames.size() != kRecipe.frames) {
    state.SkipWithError("test media could not be made with ffmpeg");
    return;
  }
  const std::string command = "ffmpeg -v error -y -r 25 -f h264 -i '" + media.stream +
                              "' -c copy '" + media.directory + "/cli.mov'";
  for (auto _ : state) {
    int status = -1;
    cliptest::RunCommand(command, &status);
    if (status != 0) state.SkipWithError("ffmpeg failed");
  }
}
BENCHMARK(BM_FfmpegCopyBaseline)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
