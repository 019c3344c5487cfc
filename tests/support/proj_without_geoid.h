// PROJ's data directory without its grids (geoid models): a directory with
// only proj.db, made the search path while code under test runs. PROJ reads
// the path when a context is made, so that code runs on a new thread.
#pragma once

#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <thread>

namespace lumo {
namespace support {

// Runs fn on a new thread (a new PROJ context) that finds no geoid model and
// waits for it; false, without running fn, when there is no PROJ database.
inline bool RunWithoutGeoid(const std::string& osTag, const std::function<void()>& fn) {
    const std::filesystem::path oDatabase = "/usr/share/proj/proj.db";
    if (!std::filesystem::exists(oDatabase)) return false;
    // Restores the search path and removes the directory on every path out.
    struct Scope {
        std::filesystem::path oDir;
        std::optional<std::string> osSaved;
        ~Scope() {
            if (osSaved) {
                setenv("PROJ_DATA", osSaved->c_str(), 1);
            } else {
                unsetenv("PROJ_DATA");
            }
            std::error_code oError;
            std::filesystem::remove_all(oDir, oError);
        }
    } oScope{std::filesystem::temp_directory_path() /
                 ("lumo_" + osTag + "_nogeoid_" + std::to_string(getpid())),
             std::nullopt};
    if (const char* pszSaved = std::getenv("PROJ_DATA")) oScope.osSaved = pszSaved;
    std::filesystem::create_directories(oScope.oDir);
    std::filesystem::create_symlink(oDatabase, oScope.oDir / "proj.db");
    setenv("PROJ_DATA", oScope.oDir.c_str(), 1);
    std::thread(fn).join();
    return true;
}

}  // namespace support
}  // namespace lumo
