# Thin wrapper over tools/install-deps.sh, CMake and CTest.
BUILD_DIR ?= build
JOBS ?= $(shell nproc)
MAKEFLAGS += --no-print-directory
CMAKE_FLAGS ?= -DCMAKE_BUILD_TYPE=RelWithDebInfo -DSORVEL_WERROR=ON

.PHONY: all deps configure build test demo bench clean

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

clean:
	@rm -rf $(BUILD_DIR) out
