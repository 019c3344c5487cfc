// The elevation model factory: kinds registered by name, and the geoid
// fallback that answers where a model has no heights.

#include <algorithm>
#include <atomic>
#include <cctype>
#include <cmath>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include "dem.h"
#include "runtime.h"

namespace nova {
namespace dem {
namespace {

constexpr const char* kSourceFile = "host/src/dem_factory.cpp";
constexpr const char* kGeoidKind = "geoid";
// Error number of the host catalogue for invalid or inconsistent input.
// Undulation tiles of the fallback: the whole EGM96 grid fits in 4 MB.
constexpr int kGeoidCacheMegabytes = 8;

struct Kind {
    std::string osName;
    DEMOpener fnOpener;
};

std::string Lower(std::string osText) {
    std::transform(osText.begin(), osText.end(), osText.begin(),
                   [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    return osText;
}

IRasterDEM* OpenGeoid(const std::string& osSource, int nCacheMegabytes) {
    const std::string osName = Lower(osSource);
    if (osName != kGeoidKind && osName != "egm96") return nullptr;
    IRasterDEM* poDem = DEMFactory::CreateGlobalDEM(false, nCacheMegabytes);
    if (poDem == nullptr) {
        throw DataException("The EGM96 geoid grid is not installed (Debian package proj-data)",
                            kSourceFile, __PRETTY_FUNCTION__, __LINE__);
    }
    return poDem;
}

class Registry {
  public:
    Registry() { maoKinds.push_back(Kind{kGeoidKind, OpenGeoid}); }

    void Register(const std::string& osName, DEMOpener fnOpener) {
        std::lock_guard<std::mutex> oLock(moMutex);
        for (Kind& oKind : maoKinds) {
            if (oKind.osName == osName) {
                oKind.fnOpener = std::move(fnOpener);
                return;
            }
        }
        maoKinds.push_back(Kind{osName, std::move(fnOpener)});
    }

    std::vector<Kind> Kinds() const {
        std::lock_guard<std::mutex> oLock(moMutex);
        return maoKinds;
    }

  private:
    mutable std::mutex moMutex;
    std::vector<Kind> maoKinds;
};

Registry& TheRegistry() {
    static Registry oRegistry;
    return oRegistry;
}

std::string KindNames(const std::vector<Kind>& aoKinds) {
    std::string osNames;
    for (const Kind& oKind : aoKinds) osNames += (osNames.empty() ? "" : ", ") + oKind.osName;
    return osNames;
}

[[noreturn]] void ThrowSource(const std::string& osMessage, int nLine) {
    throw ParameterException("osSource", 1, "", "", osMessage, kSourceFile,
                             "nova::dem::DEMFactory::CreateDEM", nLine);
}

// Answers with the inner model where it has heights, else with the geoid in
// the inner model's vertical datum.
class GeoidFallbackDEM final : public IRasterDEM {
  public:
    explicit GeoidFallbackDEM(DEMPtr poInner) : mpoInner(std::move(poInner)) {
        mbEllipsoidal = mpoInner->GetCRS()->GetVerticalDatumType() != ogc::cs::CS_VD_Orthometric;
        if (!mbEllipsoidal) return;
        mpoGeoid.reset(DEMFactory::CreateGlobalDEM(true, kGeoidCacheMegabytes));
        if (!mpoGeoid) {
            throw DataException("The EGM96 geoid grid is not installed (Debian package proj-data)",
                                kSourceFile, __PRETTY_FUNCTION__, __LINE__);
        }
        mpoToGeographic.reset(
            ogc::utils::CreateCRSTransform(mpoInner->GetCRS(), mpoGeoid->GetCRS(), 0.0));
    }

    const ogc::cs::ICRS* GetCRS() const override { return mpoInner->GetCRS(); }
    DEMExtent GetCoverage() const override { return mpoInner->GetCoverage(); }
    std::string GetDescription() const override { return mpoInner->GetDescription(); }
    void Release() override { delete this; }

    bool GetHeight(double dfX, double dfY, double& dfHeight) const override {
        return mpoInner->GetHeight(dfX, dfY, dfHeight) || Fallback(dfX, dfY, dfHeight);
    }

    int GetHeights(int nCount, const double* padfX, const double* padfY,
                   double* padfHeight) const override {
        int nFound = mpoInner->GetHeights(nCount, padfX, padfY, padfHeight);
        if (nFound == nCount) return nFound;
        for (int i = 0; i < nCount; ++i) {
            if (padfHeight[i] == kNoHeight && Fallback(padfX[i], padfY[i], padfHeight[i])) {
                ++nFound;
            }
        }
        return nFound;
    }

  private:
    ~GeoidFallbackDEM() override = default;

    // Mean sea level is height 0 above the geoid, and the undulation above
    // the ellipsoid.
    bool Fallback(double dfX, double dfY, double& dfHeight) const {
        if (!std::isfinite(dfX) || !std::isfinite(dfY)) return false;
        if (mbEllipsoidal) {
            double dfLon = 0.0;
            double dfLat = 0.0;
            double dfZ = 0.0;
            if (!mpoToGeographic ||
                !mpoToGeographic->TransformPoint(dfX, dfY, 0.0, dfLon, dfLat, dfZ) ||
                !mpoGeoid->GetHeight(dfLon, dfLat, dfHeight)) {
                return false;
            }
        } else {
            dfHeight = 0.0;
        }
        WarnOnce();
        return true;
    }

    void WarnOnce() const {
        if (mbWarned.exchange(true)) return;
        const std::string osText = FormatString(
            "Positions outside the elevation model %s: heights of the EGM96 geoid used there",
            mpoInner->GetDescription().c_str());
        IMPError(nova::kMsgInvalidInput, 0, osText.c_str());
    }

    DEMPtr mpoInner;
    DEMPtr mpoGeoid;
    ogc::MathTransformPtr mpoToGeographic;
    bool mbEllipsoidal = false;
    mutable std::atomic<bool> mbWarned{false};
};

}  // namespace

void DEMFactory::RegisterKind(const std::string& osKind, DEMOpener fnOpener) {
    if (osKind.empty() || !fnOpener || osKind.find(':') != std::string::npos) {
        throw ParameterException("osKind", 1, "", "",
                                 "Invalid elevation model kind '" + osKind + "'", kSourceFile,
                                 __PRETTY_FUNCTION__, __LINE__);
    }
    TheRegistry().Register(osKind, std::move(fnOpener));
}

std::vector<std::string> DEMFactory::GetKinds() {
    std::vector<std::string> aosNames;
    for (const Kind& oKind : TheRegistry().Kinds()) aosNames.push_back(oKind.osName);
    return aosNames;
}

IRasterDEM* DEMFactory::CreateDEM(const std::string& osSource, int nCacheMegabytes) {
    if (osSource.empty()) ThrowSource("Empty elevation source", __LINE__);
    std::vector<Kind> aoKinds = TheRegistry().Kinds();
    std::string osOwnSource = osSource;
    // "KIND:SOURCE" when KIND is a registered kind; other colons (drive
    // letters, virtual file systems) belong to the source.
    const std::size_t nColon = osSource.find(':');
    if (nColon != std::string::npos) {
        const std::string osKind = osSource.substr(0, nColon);
        auto it = std::find_if(aoKinds.begin(), aoKinds.end(),
                               [&](const Kind& oKind) { return oKind.osName == osKind; });
        if (it != aoKinds.end()) {
            aoKinds = {*it};
            osOwnSource = osSource.substr(nColon + 1);
        }
    }
    for (const Kind& oKind : aoKinds) {
        if (IRasterDEM* poDem = oKind.fnOpener(osOwnSource, nCacheMegabytes)) return poDem;
    }
    ThrowSource("No elevation model kind reads '" + osOwnSource +
                    "' (kinds tried: " + KindNames(aoKinds) + ")",
                __LINE__);
}

IRasterDEM* WithGeoidFallback(DEMPtr poInner) {
    if (!poInner) {
        throw ParameterException("poInner", 1, "", "", "Null elevation model", kSourceFile,
                                 __PRETTY_FUNCTION__, __LINE__);
    }
    return new GeoidFallbackDEM(std::move(poInner));
}

}  // namespace dem
}  // namespace nova
