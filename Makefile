# Entry points; CMake does the work. `make run` shows the system at work,
# `make test` builds and runs every test, `make check` does that with every
# compiler and sanitizer. docs/dependencies.md says what each package is for.

# What a program of ours needs to be built and to run.
BUILD_PACKAGES := g++ cmake ninja-build ccache pkg-config python3 \
	libasio-dev libsqlite3-dev libtomlplusplus-dev libsystemd-dev \
	libfmt-dev rapidjson-dev libmimalloc-dev libprotozero-dev libplist-dev \
	libtraceevent-dev libcli11-dev zlib1g-dev libcurl4-openssl-dev libdeflate-dev uuid-dev \
	node-d3 libpipewire-0.3-dev libspa-0.2-dev
# What the demonstration plays with.
RUN_PACKAGES := pipewire pipewire-bin pipewire-pulse libspa-0.2-modules wireplumber \
	sox espeak-ng sqlite3 procps
# What pictures of the report's page are made with.
PICTURE_PACKAGES := chromium chromium-driver python3-selenium
TEST_PACKAGES := libmsgpack-cxx-dev libgtest-dev libgmock-dev libbenchmark-dev libsndfile1-dev \
	clang-format python3-msgpack \
	neovim pipewire-jack jackd2 systemd mandoc zsh $(PICTURE_PACKAGES)
CHECK_PACKAGES := clang clang-tidy libclang-rt-14-dev
DEB_PACKAGES := build-essential debhelper git lintian
BENCH_PACKAGES := libmsgpack-cxx-dev libbenchmark-dev sqlite3

JOBS ?= $(shell nproc)
TEST_JOBS ?= 2
FUZZ_SECONDS ?= 60
# `make check PRESETS=gcc-tsan` for one of them; `make check TIDY=1` adds clang-tidy.
PRESETS ?= gcc-debug gcc-release gcc-asan gcc-tsan clang-debug clang-release clang-asan clang-tsan
TIDY ?=
# `make torture MINUTES=60 SEED=7`; without a seed it takes one, and prints it.
MINUTES ?= 10
SEED ?=
# `make install PREFIX=/usr DESTDIR=DIR` puts everything below DIR.
PREFIX ?= /usr/local
DESTDIR ?=
# `make run KEEP=DIR` leaves the demonstration's directories there.
KEEP ?=

# Tests of kernel event traces need a tracefs, which few containers mount.
CTEST := scripts/with-tracefs.sh ctest
CTEST_FLAGS := --output-on-failure --no-label-summary --parallel $(TEST_JOBS)
# ThreadSanitizer of these compilers does not cope with more than 28 bits of
# address space randomisation, which newer kernels use.
FIXED_ADDRESSES := setarch $(shell uname -m) -R

.DEFAULT_GOAL := build
.PHONY: deps build install deb run pictures test torture check fuzz tidy bench format clean

deps:
	@scripts/install-deps.sh $(BUILD_PACKAGES) $(RUN_PACKAGES) $(TEST_PACKAGES)

build:
	@scripts/install-deps.sh $(BUILD_PACKAGES)
	cmake --preset release
	cmake --build --preset release --parallel $(JOBS)

# The build folder remembers the prefix, which some of the installed files name.
install:
	@scripts/install-deps.sh $(BUILD_PACKAGES)
	cmake --preset release -D CMAKE_INSTALL_PREFIX=$(PREFIX)
	cmake --build --preset release --parallel $(JOBS)
	DESTDIR=$(abspath $(DESTDIR)) cmake --install build/release

# The packages are in build/deb then. JOBS does not hold here: it is the packages' own build.
deb:
	@scripts/install-deps.sh $(BUILD_PACKAGES) $(DEB_PACKAGES)
	scripts/build-deb.sh build/deb
	lintian --allow-root --fail-on error,warning build/deb/*.changes

run:
	@scripts/install-deps.sh $(BUILD_PACKAGES) $(RUN_PACKAGES)
	@$(MAKE) --no-print-directory build
	tools/demo/run-demo build/release $(if $(KEEP),KEEP=$(KEEP))

pictures: run
	@scripts/install-deps.sh $(PICTURE_PACKAGES)
	scripts/make-pictures build/release/report.html docs/pictures

test: deps
	cmake --preset test
	cmake --build --preset test --parallel $(JOBS)
	scripts/fetch-npm.sh tests/report build/test/axe
	scripts/fetch-npm.sh tests/otlp build/test/otlp
	$(CTEST) --preset test $(CTEST_FLAGS)

torture: deps
	cmake --preset test
	cmake --build --preset test --parallel $(JOBS) --target halyardd halyardctl halyard faulty_disk
	tests/torture/torture.py build/test --minutes $(MINUTES) $(if $(SEED),--seed $(SEED))

check: deps
	@scripts/install-deps.sh $(CHECK_PACKAGES)
	set -e; for preset in $(PRESETS); do \
		echo "== $$preset"; \
		wrapper=; case $$preset in *-tsan) wrapper="$(FIXED_ADDRESSES)";; esac; \
		cmake --preset $$preset; \
		$$wrapper cmake --build --preset $$preset --parallel $(JOBS); \
		scripts/fetch-npm.sh tests/report build/$$preset/axe; \
		scripts/fetch-npm.sh tests/otlp build/$$preset/otlp; \
		$$wrapper $(CTEST) --preset $$preset $(CTEST_FLAGS); \
	done
	$(MAKE) fuzz
	$(if $(TIDY),$(MAKE) tidy)

fuzz:
	@scripts/install-deps.sh $(BUILD_PACKAGES) $(CHECK_PACKAGES)
	cmake --preset fuzz
	cmake --build --preset fuzz --parallel $(JOBS)
	scripts/run-fuzzers.sh build/fuzz $(FUZZ_SECONDS)

# Reads the compile commands of the clang debug build.
tidy:
	@scripts/install-deps.sh $(BUILD_PACKAGES) $(TEST_PACKAGES) $(CHECK_PACKAGES)
	cmake --preset clang-debug
	run-clang-tidy-14 -quiet -p build/clang-debug '$(CURDIR)/(src|tools|benchmarks)/.*\.cpp'

bench:
	@scripts/install-deps.sh $(BUILD_PACKAGES) $(BENCH_PACKAGES)
	cmake --preset bench
	cmake --build --preset bench --parallel $(JOBS)
	scripts/run-benchmarks.sh build/bench

format:
	@scripts/install-deps.sh clang-format
	scripts/check-format.sh --fix

clean:
	rm -rf build
