# All fuzz targets but path_filter_work, each with the call that the including file defines:
#
#   kova_fuzz_target(<name> [LOGS] [FILES] [SOURCES ...] [LIBS ...])
#
# <name>_fuzz.cpp is linked with the objects of the first library, and compiled with those sources of
# other parts that it tries. LOGS: the library logs for some inputs. FILES: real files are made, in a
# /tmp of the target's own.
set(platform ${PROJECT_SOURCE_DIR}/platform)
set(service ${PROJECT_SOURCE_DIR}/service)
set(tool ${PROJECT_SOURCE_DIR}/tools/kovabackup)
if(KOVA_BUILD_TOOLS OR KOVA_PLATFORM STREQUAL standin)
  find_package(PkgConfig REQUIRED)
  pkg_check_modules(kova_sodium REQUIRED IMPORTED_TARGET libsodium)
endif()

kova_fuzz_target(json_text)
kova_fuzz_target(option_load LOGS)
kova_fuzz_target(path_algebra)
kova_fuzz_target(path_filter)
kova_fuzz_target(pattern_rebase)
kova_fuzz_target(process_stat
  SOURCES ${service}/file_text.cpp ${service}/process_facts.cpp)
kova_fuzz_target(replace_mustache)
kova_fuzz_target(tree_removal FILES SOURCES
  ${service}/folder_id.cpp ${service}/folder_opener.cpp ${service}/name_stack.cpp
  ${service}/tree_removal.cpp ${service}/tree_removal_path.cpp
  ${PROJECT_SOURCE_DIR}/tests/service/tree_hooks.cpp)
kova_fuzz_target(tree_walk FILES SOURCES
  ${service}/cache_folder.cpp ${service}/file_text.cpp ${service}/folder_id.cpp
  ${service}/name_stack.cpp ${service}/tree_walk.cpp ${service}/tree_walk_filter.cpp
  ${service}/tree_walk_folders.cpp ${service}/tree_walk_names.cpp)

if(KOVA_BUILD_TOOLS)
  find_package(fmt CONFIG REQUIRED)
  kova_fuzz_target(command_line SOURCES
    ${tool}/frame/command_line.cpp ${tool}/frame/declaration.cpp)
  kova_fuzz_target(pattern_file LIBS fmt::fmt PkgConfig::kova_sodium SOURCES
    ${tool}/commands/filter_command.cpp ${tool}/facts/pattern_warnings.cpp ${tool}/frame/cli.cpp
    ${tool}/frame/command_line.cpp ${tool}/frame/context.cpp ${tool}/frame/declaration.cpp
    ${tool}/frame/help.cpp ${tool}/frame/input.cpp ${tool}/frame/invocation.cpp
    ${tool}/frame/output.cpp ${tool}/frame/text.cpp)
endif()

if(KOVA_PLATFORM STREQUAL standin)
  kova_fuzz_target(ip_text LOGS SOURCES ${platform}/netsdk/hosts.cpp)
  kova_fuzz_target(platform_conf SOURCES ${platform}/config/config_text.cpp)
  kova_fuzz_target(secret_cipher LIBS PkgConfig::kova_sodium
    SOURCES ${platform}/core/crypt.cpp ${platform}/core/secret_cipher.cpp)
  kova_fuzz_target(section_file
    SOURCES ${platform}/core/section_text.cpp ${platform}/core/sz_hash.cpp)
endif()
