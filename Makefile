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
	@mkdir -p out
	@$(BUILD_DIR)/tools/sorvel encode --token 536f7276656c --crc --loop 3 -o out/token.wav
	@$(BUILD_DIR)/tools/sorvel decode out/token.wav --crc

bench: build
	@$(BUILD_DIR)/bench/sorvel_benchmarks
	@for scheme in dsss hotsound dtmf; do $(BUILD_DIR)/bench/sorvel_link_quality --scheme $$scheme --seeds 20; done

clean:
	@rm -rf $(BUILD_DIR) out
