# SPDX-License-Identifier: Apache-2.0
# Toolchain for another architecture, on a Debian that has its compiler and libraries beside its own
# (crossbuild-essential-*, libraries by dpkg --add-architecture). Tests run in qemu-user, which
# knows no filter: those of the sandbox need a kernel, and tests/kernels gives them one.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR ${KEELGATE_MACHINE})
set(CMAKE_CXX_COMPILER ${KEELGATE_MACHINE}-linux-gnu-g++)
set(CMAKE_CROSSCOMPILING_EMULATOR qemu-${KEELGATE_MACHINE}-static)
list(APPEND CMAKE_TRY_COMPILE_PLATFORM_VARIABLES KEELGATE_MACHINE)
