#include "ortho_transformer.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <map>
#include <utility>
#include <vector>

#include <cpl_minixml.h>
#include <gdal_alg.h>
#include <gdal_alg_priv.h>

#include "runtime.h"

namespace lumo {
namespace gdal {
namespace detail {
namespace {

constexpr const char* kClassName = "LumoOrthoTransformer";
// Rows of output pixels evaluated together, and the spacing of the coarse
// grid evaluated exactly within them. Cells are split further wherever the
// model departs from the interpolation by more than the error threshold.
constexpr int kBandRows = 64;
constexpr int kGridStep = 32;

// Image positions of a band of output rows over one span of columns.
struct Band {
    double dfPixel0 = 0.0;  // output pixel coordinate of the first column
    double dfLine0 = 0.0;   // output line coordinate of the first row
    int nCols = 0;
    int nRows = 0;
    std::vector<float> afZ;
    std::vector<float> afPixel;
    std::vector<float> afLine;
    std::vector<unsigned char> abyValid;

    // Row index of (dfPixel0, nCols, dfLine) in this band, or -1.
    int RowOf(double dfPixel, int nCount, double dfLine) const {
        if (nRows == 0 || dfPixel != dfPixel0 || nCount != nCols) return -1;
        const double dfRow = dfLine - dfLine0;
        const int nRow = static_cast<int>(dfRow);
        return dfRow == nRow && nRow >= 0 && nRow < nRows ? nRow : -1;
    }
};

// One transformer: the shared run and a band of its own.
struct TransformerState {
    std::shared_ptr<const OrthoRun> poRun;
    Band sBand;
    std::string osRegistryKey;
};

// What GDAL is given: its transformer header first, then our state.
struct TransformerArg {
    GDALTransformerInfo sTI;
    TransformerState* poState;
};

// Runs by key, so that the deserializer GDAL calls to clone a transformer
// finds the run of the original.
class RunRegistry {
  public:
    std::string Add(const std::shared_ptr<const OrthoRun>& poRun) {
        std::lock_guard<std::mutex> oLock(moMutex);
        for (auto it = moRuns.begin(); it != moRuns.end();) {
            it = it->second.expired() ? moRuns.erase(it) : std::next(it);
        }
        std::string osKey = std::to_string(++mnNext);
        moRuns[osKey] = poRun;
        return osKey;
    }
    std::shared_ptr<const OrthoRun> Find(const std::string& osKey) {
        std::lock_guard<std::mutex> oLock(moMutex);
        auto it = moRuns.find(osKey);
        return it == moRuns.end() ? nullptr : it->second.lock();
    }

  private:
    std::mutex moMutex;
    unsigned long mnNext = 0;
    std::map<std::string, std::weak_ptr<const OrthoRun>> moRuns;
};

RunRegistry& Registry() {
    static RunRegistry oRegistry;
    return oRegistry;
}

void CleanupTransformer(void* pArg) {
    auto* psArg = static_cast<TransformerArg*>(pArg);
    if (psArg == nullptr) return;
    delete psArg->poState;
    delete psArg;
}

CPLXMLNode* SerializeTransformer(void* pArg) {
    const auto* psArg = static_cast<TransformerArg*>(pArg);
    CPLXMLNode* psTree = CPLCreateXMLNode(nullptr, CXT_Element, kClassName);
    CPLAddXMLAttributeAndValue(psTree, "run", psArg->poState->osRegistryKey.c_str());
    return psTree;
}

void* DeserializeTransformer(CPLXMLNode* psTree) {
    const char* pszKey = CPLGetXMLValue(psTree, "run", nullptr);
    if (pszKey == nullptr) return nullptr;
    std::shared_ptr<const OrthoRun> poRun = Registry().Find(pszKey);
    return poRun ? CreateOrthoTransformer(std::move(poRun)) : nullptr;
}

// True for a row of consecutive output pixels, the warp kernel's requests.
bool IsRow(int nCount, const double* padfX, const double* padfY) {
    if (nCount < 2) return false;
    for (int i = 1; i < nCount; ++i) {
        if (padfY[i] != padfY[0] || padfX[i] != padfX[0] + i) return false;
    }
    return true;
}

void ComputeBand(const OrthoRun& oRun, double dfPixel0, int nCols, double dfLine0, Band& sBand) {
    const double* gt = oRun.GeoTransform();
    const int nRemaining = oRun.Lines() - static_cast<int>(std::floor(dfLine0));
    const int nRows = std::max(1, std::min(kBandRows, nRemaining));
    const std::size_t nPoints = static_cast<std::size_t>(nCols) * nRows;
    sBand.dfPixel0 = dfPixel0;
    sBand.dfLine0 = dfLine0;
    sBand.nCols = nCols;
    sBand.nRows = 0;  // not valid until filled
    sBand.afZ.resize(nPoints);
    sBand.afPixel.resize(nPoints);
    sBand.afLine.resize(nPoints);
    sBand.abyValid.resize(nPoints);
    const double dfX0 = gt[0] + dfPixel0 * gt[1];
    const double dfY0 = gt[3] + dfLine0 * gt[5];
    const OrthoFrame& oFrame = oRun.Frame();
    oFrame.HeightsOfGrid(dfX0, dfY0, gt[1], gt[5], nCols, nRows, sBand.afZ.data());
    // Failed points are flagged in abyValid; the result adds nothing.
    oFrame.Model().GroundToImage(nCols, nRows, kGridStep, nullptr, nullptr, sBand.afZ.data(),
                                 sBand.afPixel.data(), sBand.afLine.data(), sBand.abyValid.data(),
                                 dfX0, dfY0, gt[1], gt[5], oRun.Tolerance(), false);
    sBand.nRows = nRows;
}

void TransformRow(TransformerState& oState, int nCount, double* padfX, double* padfY,
                  int* panSuccess) {
    Band& sBand = oState.sBand;
    int nRow = sBand.RowOf(padfX[0], nCount, padfY[0]);
    if (nRow < 0) {
        ComputeBand(*oState.poRun, padfX[0], nCount, padfY[0], sBand);
        nRow = 0;
    }
    const std::size_t nOffset = static_cast<std::size_t>(nRow) * nCount;
    for (int i = 0; i < nCount; ++i) {
        const bool bOk = sBand.abyValid[nOffset + i] != 0;
        panSuccess[i] = bOk ? TRUE : FALSE;
        if (bOk) {
            padfX[i] = sBand.afPixel[nOffset + i];
            padfY[i] = sBand.afLine[nOffset + i];
        }
    }
}

void TransformPoints(const OrthoRun& oRun, bool bDstToSrc, int nCount, double* padfX, double* padfY,
                     int* panSuccess) {
    const double* gt = oRun.GeoTransform();
    for (int i = 0; i < nCount; ++i) {
        bool bOk = false;
        double dfOut1 = 0.0;
        double dfOut2 = 0.0;
        if (bDstToSrc) {
            const double dfX = gt[0] + padfX[i] * gt[1] + padfY[i] * gt[2];
            const double dfY = gt[3] + padfX[i] * gt[4] + padfY[i] * gt[5];
            bOk = oRun.Frame().GroundToImage(dfX, dfY, dfOut1, dfOut2);
        } else {
            double dfX = 0.0;
            double dfY = 0.0;
            // North-up output grids: no rotation terms to invert.
            bOk = oRun.Frame().ImageToGround(padfX[i], padfY[i], dfX, dfY);
            dfOut1 = (dfX - gt[0]) / gt[1];
            dfOut2 = (dfY - gt[3]) / gt[5];
        }
        panSuccess[i] = bOk ? TRUE : FALSE;
        if (bOk) {
            padfX[i] = dfOut1;
            padfY[i] = dfOut2;
        }
    }
}

}  // namespace

OrthoRun::OrthoRun(std::shared_ptr<const OrthoFrame> poFrame, const double* padfGeoTransform,
                   int nPixels, int nLines, double dfTolerance)
    : mpoFrame(std::move(poFrame)), mnPixels(nPixels), mnLines(nLines), mdfTolerance(dfTolerance) {
    std::copy(padfGeoTransform, padfGeoTransform + 6, madfGT);
}

void OrthoRun::RecordError(const std::string& osMessage) const {
    std::lock_guard<std::mutex> oLock(moMutex);
    if (mosError.empty()) mosError = osMessage;
}

std::string OrthoRun::FirstError() const {
    std::lock_guard<std::mutex> oLock(moMutex);
    return mosError;
}

void* CreateOrthoTransformer(std::shared_ptr<const OrthoRun> poRun) {
    auto poState = std::make_unique<TransformerState>();
    poState->osRegistryKey = Registry().Add(poRun);
    poState->poRun = std::move(poRun);
    auto* psArg = new TransformerArg{};
    std::memcpy(psArg->sTI.abySignature, GDAL_GTI2_SIGNATURE, sizeof(psArg->sTI.abySignature));
    psArg->sTI.pszClassName = kClassName;
    psArg->sTI.pfnTransform = OrthoTransform;
    psArg->sTI.pfnCleanup = CleanupTransformer;
    psArg->sTI.pfnSerialize = SerializeTransformer;
    psArg->sTI.pfnCreateSimilar = nullptr;
    psArg->poState = poState.release();
    return psArg;
}

int OrthoTransform(void* pTransformerArg, int bDstToSrc, int nPointCount, double* padfX,
                   double* padfY, double* /*padfZ*/, int* panSuccess) {
    auto* psArg = static_cast<TransformerArg*>(pTransformerArg);
    TransformerState& oState = *psArg->poState;
    try {
        if (bDstToSrc && IsRow(nPointCount, padfX, padfY)) {
            TransformRow(oState, nPointCount, padfX, padfY, panSuccess);
        } else {
            TransformPoints(*oState.poRun, bDstToSrc != FALSE, nPointCount, padfX, padfY,
                            panSuccess);
        }
        return TRUE;
    } catch (const std::exception& e) {
        oState.poRun->RecordError(e.what());
    } catch (...) {
        oState.poRun->RecordError("unexpected failure while transforming points");
    }
    std::fill(panSuccess, panSuccess + nPointCount, FALSE);
    return FALSE;
}

void RegisterOrthoTransformer() {
    static std::once_flag oOnce;
    std::call_once(oOnce, [] {
        GDALRegisterTransformDeserializer(kClassName, OrthoTransform, DeserializeTransformer);
    });
}

}  // namespace detail
}  // namespace gdal
}  // namespace lumo
