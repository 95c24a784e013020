# The two commands a newcomer needs: `make run` and `make test`.
BUILD ?= build
BUILD_TYPE ?= RelWithDebInfo
# The benchmark has its own tree (make bench); the test build leaves it out.
CMAKE_FLAGS ?= -DTOLKD_BUILD_BENCH=OFF
JOBS ?= $(shell nproc 2>/dev/null || echo 2)
# The tests spend most of their time waiting on simulated peers, links and
# timers, not on the processor: twice as many at once as there are processors
# halves the wall time of `make test`. The sanitizer build is heavier and keeps
# one per processor.
TEST_JOBS ?= $(shell echo $$(( $(JOBS) * 2 )))

.PHONY: all run test soak deps configure build clean asan bench test-arm64

all: build

deps:
	@tools/ensure-deps.sh

# Configures when the tree has never been configured successfully or was
# configured with other settings (make BUILD_TYPE=Debug after a first build). The
# stamp is written only after a configure that succeeded, and a failed one
# drops its cache (which would keep a bad setting such as a missing compiler),
# so the next make starts afresh instead of being wedged.
CONFIG_STAMP = $(BUILD)/.make-configured
CONFIG_LINE = $(BUILD_TYPE) $(CMAKE_FLAGS)

configure: deps
	@if [ ! -f $(BUILD)/CMakeCache.txt ] || [ "$$(cat $(CONFIG_STAMP) 2>/dev/null)" != "$(CONFIG_LINE)" ]; then \
	  rm -f $(CONFIG_STAMP); \
	  if cmake -S . -B $(BUILD) -DCMAKE_BUILD_TYPE=$(BUILD_TYPE) $(CMAKE_FLAGS); then \
	    echo "$(CONFIG_LINE)" > $(CONFIG_STAMP); \
	  else \
	    rm -f $(BUILD)/CMakeCache.txt; exit 1; \
	  fi; \
	fi

build: configure
	cmake --build $(BUILD) -j $(JOBS)

run: build
	$(BUILD)/sim/tolk-sim run $(ARGS)

# Everything but the soak, which has its own target (CI runs both).
test: build
	cd $(BUILD) && ctest --output-on-failure -j $(TEST_JOBS) -LE soak

soak: build
	cd $(BUILD) && ctest --output-on-failure -C soak -L soak

# The whole suite under AddressSanitizer and UndefinedBehaviorSanitizer.
asan:
	$(MAKE) test soak BUILD=build-asan BUILD_TYPE=Debug TEST_JOBS=$(JOBS) CMAKE_FLAGS="-DTOLKD_SANITIZE=ON -DTOLKD_BUILD_BENCH=OFF"

# tolkd cross-built for 64-bit Arm and run under qemu-user inside the x86-64
# simulated device (build-arm64/, and build/ for the x86-64 side; docs/ARM64.md).
test-arm64:
	tools/test-arm64.sh

# Every performance measurement on a fresh simulated device, as one table.
bench: deps
	tools/bench.sh

# Every tree a target of this Makefile or a tool under tools/ builds.
clean:
	rm -rf $(BUILD) build build-asan build-arm64 build-arm64-host build-bench build-fuzz
