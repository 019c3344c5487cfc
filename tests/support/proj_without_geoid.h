// PROJ's data directory without its grids (geoid models): a directory with
// only proj.db, made the search path while the object lives. PROJ reads the
// path when a context is made, so the code under test runs on a new thread.
#pragma once

#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <functional>
#include <string>
#include <thread>

namespace lumo {
namespace support {

class ProjWithoutGeoid {
  public:
    static bool Available() { return std::filesystem::exists(Database()); }

    explicit ProjWithoutGeoid(const std::string& osTag)
        : m_oDir(std::filesystem::temp_directory_path() /
                 ("lumo_" + osTag + "_nogeoid_" + std::to_string(getpid()))) {
        const char* pszSaved = std::getenv("PROJ_DATA");
        m_bHadData = pszSaved != nullptr;
        if (m_bHadData) m_osSaved = pszSaved;
        std::filesystem::create_directories(m_oDir);
        std::filesystem::create_symlink(Database(), m_oDir / "proj.db");
        setenv("PROJ_DATA", m_oDir.c_str(), 1);
    }
    ~ProjWithoutGeoid() {
        if (m_bHadData) {
            setenv("PROJ_DATA", m_osSaved.c_str(), 1);
        } else {
            unsetenv("PROJ_DATA");
        }
        std::error_code oError;
        std::filesystem::remove_all(m_oDir, oError);
    }
    ProjWithoutGeoid(const ProjWithoutGeoid&) = delete;
    ProjWithoutGeoid& operator=(const ProjWithoutGeoid&) = delete;

    // Runs fn on a new thread (a new PROJ context) and waits for it.
    static void RunInNewContext(const std::function<void()>& fn) {
        std::thread oWorker(fn);
        oWorker.join();
    }

  private:
    static std::filesystem::path Database() { return "/usr/share/proj/proj.db"; }

    std::filesystem::path m_oDir;
    bool m_bHadData = false;
    std::string m_osSaved;
};

}  // namespace support
}  // namespace lumo
