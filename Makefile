# Entry points. Every target installs what is missing first (apt-get, when run
# as root), then configures and builds with CMake.
BUILD_DIR ?= build
BUILD_TYPE ?= RelWithDebInfo
CMAKE_FLAGS ?=
# CI treats every warning as an error.
ifeq ($(CI),true)
CMAKE_FLAGS += -DVELTO_WERROR=ON
endif

.PHONY: deps configure build test demo bench clean

deps:
	@scripts/install-deps

configure: deps
	@cmake -S . -B $(BUILD_DIR) -G Ninja -DCMAKE_BUILD_TYPE=$(BUILD_TYPE) $(CMAKE_FLAGS) >/dev/null

build: configure
	@cmake --build $(BUILD_DIR)

test: build
	@cd $(BUILD_DIR) && ctest --output-on-failure -j2

demo: build
	@if [ -x $(BUILD_DIR)/tools/veltotouch ]; then scripts/demo $(BUILD_DIR); \
	else echo "make demo: the veltotouch tool is not built yet (see README)"; fi

bench:
	@$(MAKE) --no-print-directory build BUILD_DIR=build-release BUILD_TYPE=Release
	@for b in build-release/bench/bench_*; do [ -x "$$b" ] && "$$b" --benchmark_repetitions=5 --benchmark_report_aggregates_only=true; done

clean:
	rm -rf build build-release build-asan build-tsan build-fuzz
