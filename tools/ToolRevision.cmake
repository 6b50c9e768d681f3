# Writes the git revision of SOURCE_DIR into the header OUTPUT as
# VELTO_GIT_REVISION: the abbreviated commit, with "-dirty" when tracked files
# differ from it, or "unknown" when there is no git or SOURCE_DIR is not the
# top of a git checkout (an unpacked source tree inside some other
# repository must not take that repository's commit). Run at every build; the
# header is only rewritten when its text changes, so an unchanged revision
# rebuilds nothing.
#   cmake -DSOURCE_DIR=... -DOUTPUT=... -P ToolRevision.cmake
set(revision "unknown")
find_package(Git QUIET)
if(GIT_FOUND)
  execute_process(COMMAND "${GIT_EXECUTABLE}" -C "${SOURCE_DIR}" rev-parse --show-toplevel
                  RESULT_VARIABLE result OUTPUT_VARIABLE top ERROR_QUIET OUTPUT_STRIP_TRAILING_WHITESPACE)
  file(REAL_PATH "${SOURCE_DIR}" source)
  if(result EQUAL 0 AND top)
    file(REAL_PATH "${top}" top)
  endif()
  if(result EQUAL 0 AND top STREQUAL source)
    execute_process(COMMAND "${GIT_EXECUTABLE}" -C "${SOURCE_DIR}" rev-parse --short=12 HEAD
                    RESULT_VARIABLE result OUTPUT_VARIABLE commit ERROR_QUIET OUTPUT_STRIP_TRAILING_WHITESPACE)
    if(result EQUAL 0 AND commit)
      set(revision "${commit}")
      # Without optional locks: a build must not hold the index lock while
      # the developer runs git.
      execute_process(COMMAND "${GIT_EXECUTABLE}" --no-optional-locks -C "${SOURCE_DIR}" status --porcelain
                              --untracked-files=no
                      RESULT_VARIABLE result OUTPUT_VARIABLE changes ERROR_QUIET)
      if(result EQUAL 0 AND NOT changes STREQUAL "")
        string(APPEND revision "-dirty")
      endif()
    endif()
  endif()
endif()

set(text "#pragma once\n// Written at build time by tools/ToolRevision.cmake.\n#define VELTO_GIT_REVISION \"${revision}\"\n")
set(previous "")
if(EXISTS "${OUTPUT}")
  file(READ "${OUTPUT}" previous)
endif()
if(NOT previous STREQUAL text)
  file(WRITE "${OUTPUT}" "${text}")
endif()
