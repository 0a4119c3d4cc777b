// Inputs shared by the benchmarks: the cache directory outside the source
// tree and the large WMV made there once with ffmpeg.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace plimo_bench {

// $XDG_CACHE_HOME/plimo-bench, else ~/.cache/plimo-bench, else /tmp/plimo-bench.
std::string default_cache_dir();

// CACHE/big.wmv: 60 s of 1280x720 WMV2 at 30 Mbit/s with key frames every
// 2 s and WMA2 audio, made with ffmpeg the first time; "" when it cannot be
// made (ffmpeg missing).
std::string big_file(const std::string& cache);

// $ASF_CORPUS, else the corpus beside the checkout (BUILD/bench/ ->
// ../../../shared/corpus).
std::string default_corpus_dir();

// The .asf, .wmv and .wma files of `dir`, sorted.
std::vector<std::string> corpus_files(const std::string& dir);

// The whole file into *out; false when it cannot be read.
bool read_file(const std::string& path, std::vector<uint8_t>* out);

}  // namespace plimo_bench
