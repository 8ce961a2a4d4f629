# Thin wrapper over tools/install-deps.sh, CMake and CTest.
BUILD_DIR ?= build
JOBS ?= $(shell nproc)
MAKEFLAGS += --no-print-directory
SHELL := /bin/bash
CMAKE_FLAGS ?= -DCMAKE_BUILD_TYPE=RelWithDebInfo -DSORVEL_WERROR=ON

.PHONY: all deps configure build test demo bench soak soak-long soak-stream sanitize arm64 fuzz fuzz-build fuzz-long-build fuzz-long clean

all: build

deps:
	@bash tools/install-deps.sh

configure: deps
	@cmake -S . -B $(BUILD_DIR) $(CMAKE_FLAGS) >/dev/null

build: configure
	@cmake --build $(BUILD_DIR) -j $(JOBS)

test: build
	@cd $(BUILD_DIR) && ctest --output-on-failure -j $(JOBS)

demo: build
	@bash tools/demo.sh $(BUILD_DIR)/tools/sorvel out

bench: build
	@$(BUILD_DIR)/bench/sorvel_benchmarks
	@mkdir -p out
	@$(BUILD_DIR)/tools/sorvel eval --scheme dsss,hotsound,dtmf --seeds 20 --plot out/link-quality.svg
	@$(BUILD_DIR)/tools/sorvel eval --scheme dsss,hotsound,dtmf --noise white --snr 10 \
	  --room 4x3x2.5:0.4,6x5x2.7:0.6,10x8x3.5:1.0 --distances 0.5,1,2,3,5 --source omni \
	  --seeds 5 --plot out/link-quality-rooms.svg

# Two hours through every decoder kind; prints the figures.
soak: build
	@$(BUILD_DIR)/bench/sorvel_soak --minutes 120 --every 180

# SOAK_HOURS through every decoder kind (or SOAK_KINDS), a broadcast every
# ten minutes; prints the heap and RSS every hour.
SOAK_HOURS ?= 100
SOAK_KINDS ?= dsss,hotsound,dtmf
soak-long: build
	@$(BUILD_DIR)/bench/sorvel_soak --hours $(SOAK_HOURS) --every 600 --kinds $(SOAK_KINDS)

# HOURS of raw PCM through `sorvel decode -` (SCHEME dsss, hotsound or
# dtmf), a broadcast every ten minutes; counts them and reports the peak RSS.
HOURS ?= 42
SCHEME ?= dsss
soak-stream: build
	@bash tools/stream_soak.sh --hours $(HOURS) --every 600 --scheme $(SCHEME) \
	  --build $(BUILD_DIR) --out out/stream-soak-$(SCHEME)

# The test suite under AddressSanitizer + UBSan. The JVM tests are left out:
# the JVM does not start with the ASan runtime preloaded into its process.
sanitize: deps
	@cmake -S . -B build-sanitize -DCMAKE_BUILD_TYPE=Debug -DSORVEL_SANITIZE=ON \
	  -DSORVEL_WERROR=ON -DSORVEL_BUILD_BENCHMARKS=OFF -DSORVEL_BUILD_JAVA=OFF \
	  -DSORVEL_BUILD_PYTHON=OFF >/dev/null
	@cmake --build build-sanitize -j $(JOBS)
	@cd build-sanitize && ctest --output-on-failure -j $(JOBS) -LE soak

# The library and its tests cross-built for arm64 and run under qemu-user.
# Death tests run there too: the test main makes them threadsafe (the binary
# is re-executed for each), since a forked child hangs under qemu-user.
arm64:
	@bash tools/install-deps.sh --arm64
	@cmake -S . -B build-arm64 -DCMAKE_TOOLCHAIN_FILE=cmake/aarch64-linux-gnu.cmake \
	  -DCMAKE_BUILD_TYPE=RelWithDebInfo -DSORVEL_WERROR=ON -DSORVEL_BUILD_TOOLS=OFF \
	  -DSORVEL_BUILD_BENCHMARKS=OFF -DSORVEL_BUILD_JAVA=OFF -DSORVEL_BUILD_PYTHON=OFF >/dev/null
	@cmake --build build-arm64 -j $(JOBS)
	@cd build-arm64 && ctest --output-on-failure -j $(JOBS) --timeout 300

# Every fuzzer for half of FUZZ_SECONDS (eight targets: FUZZ_SECONDS=60 keeps
# the fuzzing near four minutes) from seeds made of encoded tokens. The
# per-decoder fuzzers take short inputs (a settings block and an audio
# script); the hotsound one needs a whole default broadcast.
FUZZ_SECONDS ?= 60
FUZZERS = decoder symbol token_selector sound_file dsss_decoder hotsound_decoder \
  dtmf_decoder decoder_registry
fuzz-build:
	@bash tools/install-deps.sh --fuzz
	@cmake -S . -B build-fuzz -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++ \
	  -DCMAKE_BUILD_TYPE=RelWithDebInfo -DSORVEL_FUZZ=ON >/dev/null
	@cmake --build build-fuzz -j $(JOBS)
	@build-fuzz/fuzz/fuzz_seeds build-fuzz/corpus

fuzz: fuzz-build
	@for f in $(FUZZERS); do \
	  bash tools/run-fuzzer.sh build-fuzz $$f -max_total_time=$$(( $(FUZZ_SECONDS) / 2 )) || exit 1; \
	done

# Every fuzzer until FUZZ_RUNS executions (default a million) or
# FUZZ_LONG_SECONDS (default ten minutes), one at a time; prints per target
# the executions, the rate and libFuzzer's final coverage (cov: edges, ft:
# features). FUZZ_LONG picks targets.
# The long runs use their own build, build-fuzz-long: coverage counters
# without comparison tracing (-fno-sanitize-coverage=trace-cmp) and UBSan
# without ASan. Tracing each comparison of the DSP inner loops, ASan's
# checks and its allocator's page faults took about three quarters of a
# decoder run; the short stage above keeps all of them, and inputs kept in
# fuzz/regressions run there too.
FUZZ_RUNS ?= 1000000
FUZZ_LONG_SECONDS ?= 600
FUZZ_LONG ?= $(FUZZERS)
fuzz-long-build:
	@bash tools/install-deps.sh --fuzz
	@cmake -S . -B build-fuzz-long -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++ \
	  -DCMAKE_BUILD_TYPE=RelWithDebInfo -DSORVEL_FUZZ=ON -DSORVEL_FUZZ_SANITIZERS=undefined \
	  -DSORVEL_FUZZ_TRACE_CMP=OFF >/dev/null
	@cmake --build build-fuzz-long -j $(JOBS)
	@build-fuzz-long/fuzz/fuzz_seeds build-fuzz-long/corpus

fuzz-long: fuzz-long-build
	@for f in $(FUZZ_LONG); do \
	  bash tools/run-fuzzer.sh build-fuzz-long $$f -runs=$(FUZZ_RUNS) \
	    -max_total_time=$(FUZZ_LONG_SECONDS) || exit 1; \
	done

clean:
	@rm -rf $(BUILD_DIR) build-sanitize build-arm64 build-fuzz build-fuzz-long out

# The browser page, built with emscripten into $(WEB_BUILD_DIR)/dist, and its
# test: headless Chromium whose fake microphone plays a broadcast that the
# host `sorvel` wrote (screenshots in out/).
WEB_BUILD_DIR ?= build-web
.PHONY: web web-test
web:
	@bash tools/install-deps.sh --web
	@bash web/build.sh $(WEB_BUILD_DIR) $(JOBS)

web-test: web configure
	@cmake --build $(BUILD_DIR) -j $(JOBS) --target sorvel
	@cd web && npm ci --no-audit --no-fund --loglevel=error
	@SORVEL_WEB_DIST=$(CURDIR)/$(WEB_BUILD_DIR)/dist SORVEL_BIN=$(CURDIR)/$(BUILD_DIR)/tools/sorvel \
	  SORVEL_OUT=$(CURDIR)/out node --test web/test/page.test.mjs
