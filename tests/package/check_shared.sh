#!/usr/bin/env bash
# The tests of the package with shared libraries: builds them in build-shared and runs tests/package against them. Apart from
# ./test because it takes a third build. Options are passed on to the test program.
set -euo pipefail
cd "$(dirname "$0")/../.."
. cmake/ensure-packages.sh
build_vemo build-shared package_tests -DBUILD_SHARED_LIBS=ON -DVEMO_WERROR=ON
build-shared/tests/package_tests "$@"
