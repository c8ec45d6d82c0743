# The two set-up commands of the README: `make run` and `make test`.
# Both install what is missing, configure and build first.

BUILD_DIR  ?= build
BUILD_TYPE ?= Release
# SANITIZE=address or SANITIZE=thread builds into its own directory.
SANITIZE   ?=
ifneq ($(SANITIZE),)
BUILD_DIR := build-$(SANITIZE)
BUILD_TYPE := RelWithDebInfo
endif

.PHONY: all deps configure build run test bench clean

all: build

deps:
	@scripts/install-deps

configure: deps
	@cmake -S . -B $(BUILD_DIR) -G Ninja -DCMAKE_BUILD_TYPE=$(BUILD_TYPE) -DZAF_SANITIZE=$(SANITIZE) >/dev/null

build: configure
	@cmake --build $(BUILD_DIR)

test: build
	@cd $(BUILD_DIR) && QT_QPA_PLATFORM=offscreen TSAN_OPTIONS="suppressions=$(CURDIR)/scripts/tsan.supp $(TSAN_OPTIONS)" \
	  LSAN_OPTIONS="suppressions=$(CURDIR)/scripts/lsan.supp $(LSAN_OPTIONS)" \
	  ctest --output-on-failure -j2 --timeout 600

run: build
	@scripts/run-main

bench: build
	@cmake --build $(BUILD_DIR) --target benchmarks && scripts/run-benchmarks $(BUILD_DIR)

clean:
	rm -rf build build-address build-thread
