# Entry points. Every target installs what is missing first (apt-get, when run
# as root), then configures and builds with CMake.
BUILD_DIR ?= build
BUILD_TYPE ?= RelWithDebInfo
CMAKE_FLAGS ?=
# CI treats every warning as an error.
ifeq ($(CI),true)
CMAKE_FLAGS += -DVELTO_WERROR=ON
endif

.PHONY: deps configure build test demo bench bench-key-latency bench-record package demo-system clean

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

# The Release build installs where a system service's files are looked for:
# the package, the benchmarks and a `sudo cmake --install build-release` share it.
RELEASE = $(MAKE) --no-print-directory build BUILD_DIR=build-release BUILD_TYPE=Release \
	CMAKE_FLAGS="$(CMAKE_FLAGS) -DCMAKE_INSTALL_PREFIX=/usr"

bench:
	@$(RELEASE)
	@for b in build-release/bench/bench_*; do [ -x "$$b" ] && "$$b" --benchmark_repetitions=5 --benchmark_report_aggregates_only=true; done

# From a report written into a virtual surface to its key on evdev, through
# the daemon, in the VM (bench/bench_key_latency.cpp says what is timed).
bench-key-latency:
	@$(RELEASE)
	@scripts/bench-key-latency --build build-release

# What `veltotouch record` costs at 1,000 reports a second, in the VM.
bench-record:
	@$(RELEASE)
	@scripts/bench-record --build build-release

# The Debian package, build-release/veltotouch_VERSION_amd64.deb.
package:
	@$(RELEASE)
	@cd build-release && cpack -G DEB

# The package installed in a VM with systemd, an emulated surface playing the
# demo recording, and each gesture beside the key that libinput saw.
demo-system: package
	@scripts/demo-system build-release/veltotouch_*_amd64.deb

clean:
	rm -rf build build-release build-asan build-tsan build-fuzz
