# Entry points: `make demo` and `make test` set up, build and run on a fresh
# machine. Missing Debian packages are installed with apt-get when running as
# root; otherwise the exact install line is printed and make stops.

BUILD      ?= build
SAN_BUILD  ?= build-san
REL_BUILD  ?= build-release
FUZZ_TIME  ?= 20
JOBS       ?= $(shell nproc 2>/dev/null || echo 2)

# What each package is for: see README.md, "Dependencies".
PACKAGES = cmake ninja-build g++ clang libclang-rt-14-dev libgtest-dev python3 \
           python3-dbfread python3-dbf libdbd-xbase-perl libxbase64-dev shapelib gdal-bin pgdbf dpkg-dev \
           libsqlite3-dev sqlite3 postgresql

.PHONY: all setup build build-release demo test test-sanitize bench package clean

all: build

setup:
	@missing=""; \
	for p in $(PACKAGES); do \
	  dpkg-query -W -f='$${Status}' $$p 2>/dev/null | grep -q "install ok installed" || missing="$$missing $$p"; \
	done; \
	if [ -n "$$missing" ]; then \
	  if [ "$$(id -u)" = 0 ]; then \
	    echo "installing:$$missing"; \
	    apt-get update -qq && DEBIAN_FRONTEND=noninteractive apt-get install -y -qq$$missing >/dev/null || exit 1; \
	  else \
	    echo "missing packages; run:"; echo "  sudo apt-get install -y$$missing"; exit 1; \
	  fi; \
	fi

build: setup
	cmake -S . -B $(BUILD) -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
	ninja -C $(BUILD) -j $(JOBS)

demo: build
	$(BUILD)/zqdb info examples/customers.dbf
	@echo
	$(BUILD)/zqdb cat examples/customers.dbf --codepage 850 --format table
	@echo
	@mkdir -p $(BUILD)/demo
	$(BUILD)/zqdb convert examples/customers.dbf $(BUILD)/demo/customers.dbf --to foxpro --codepage 850 \
	  --index city=CITY+NAME --no-progress
	$(BUILD)/zqdb info $(BUILD)/demo/customers.dbf --type foxpro
	$(BUILD)/zqdb keys $(BUILD)/demo/customers.dbf --index CITY --format jsonl | head -n 3
	$(BUILD)/zqdb convert $(BUILD)/demo/customers.dbf $(BUILD)/demo/customers.jsonl --codepage 850 --no-progress
	head -n 3 $(BUILD)/demo/customers.jsonl

test: build
	ctest --test-dir $(BUILD) --output-on-failure -j $(JOBS)
	$(MAKE) --no-print-directory build-release
	$(MAKE) --no-print-directory test-sanitize

# The whole tree at -O3 once, built only: the optimiser's warnings (GCC's
# stringop-overflow and array-bounds) appear at no other level.
build-release: setup
	cmake -S . -B $(REL_BUILD) -G Ninja -DCMAKE_BUILD_TYPE=Release >/dev/null
	ninja -C $(REL_BUILD) -j $(JOBS)

# Unit and CLI tests under AddressSanitizer and UndefinedBehaviorSanitizer, and
# every libFuzzer target for a bounded time, all built with clang.
test-sanitize: setup
	CXX=clang++ cmake -S . -B $(SAN_BUILD) -G Ninja -DZQ_SANITIZE=ON -DZQ_FUZZ=ON \
	  -DZQ_FUZZ_TIME=$(FUZZ_TIME) -DCMAKE_BUILD_TYPE=Debug >/dev/null
	ninja -C $(SAN_BUILD) -j $(JOBS)
	ctest --test-dir $(SAN_BUILD) --output-on-failure -L 'unit|cli|fuzz-smoke' -j $(JOBS)

bench: build
	bench/run.sh $(BUILD)/zqdb

# A Debian package of zqdb, the module and the headers, for /usr.
PKG_BUILD ?= build-pkg
package: setup
	cmake -S . -B $(PKG_BUILD) -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo -DCMAKE_INSTALL_PREFIX=/usr >/dev/null
	ninja -C $(PKG_BUILD) -j $(JOBS) zqdb zqdbse zqhost
	cd $(PKG_BUILD) && cpack -G DEB
	@ls $(PKG_BUILD)/*.deb

clean:
	rm -rf $(BUILD) $(SAN_BUILD) $(REL_BUILD) $(PKG_BUILD)
