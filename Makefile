# For people. Everything here is a thin layer over the CMake presets (CMakePresets.json) and scripts/.
#
#   make demo     a tour of the daemon with sample applications      make lint    format, clang's checks, tree checks
#   make test     build and run all tests                            make bench   benchmarks, under two minutes
#   make build    build only (build/bin)                             make fuzz    each fuzz target for FUZZ_SECONDS
#   make deps     install the Debian packages that are missing       make soak    the long system tests
#   make clean    remove build/
#
# demo and test do the whole set-up themselves, on a fresh checkout too.

FUZZ_SECONDS ?= 600
JOBS ?= $(shell nproc)

.PHONY: all deps build demo test lint bench fuzz soak clean
all: build

deps:
	@scripts/deps

# Configuring again is cheap and takes new files and lists into account.
build: deps
	@cmake --preset release -Wno-dev >/dev/null
	@cmake --build --preset release -j $(JOBS)

demo: build
	@scripts/demo

test: build
	@ctest --preset release -j $(JOBS) -LE soak --no-tests=error --output-log $(CURDIR)/build/ctest.log

lint:
	@scripts/deps --lint
	@scripts/lint

bench: build
	@scripts/bench

fuzz:
	@scripts/deps --lint
	@FUZZ_SECONDS=$(FUZZ_SECONDS) scripts/fuzz

soak: build
	@ctest --preset release -L soak --no-tests=error

clean:
	@rm -rf build
