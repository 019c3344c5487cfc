// Radar model record and entry points: allocation, release and copy of
// RTCSInfo_t, and the ground-to-image and image-to-ground transforms.
#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstdlib>
#include <cstring>

#include "errors.h"
#include "lumo_ephemeris.h"
#include "lumo_rtcs.h"
#include "rpc.h"
#include "rtcs_internal.h"
#include "runtime.h"

namespace lumo::rtcs {
namespace {

double* NewTable(int nLines, int nPerLine) {
    return static_cast<double*>(
        HCalloc(static_cast<std::uint64_t>(nLines) * nPerLine, sizeof(double)));
}

void FreeTable(double*& padf) {
    std::free(padf);
    padf = nullptr;
}

// Every derived table with its number of values per line.
struct TableSlot {
    double* RTCSInfo_t::*pMember;
    int nPerLine;
};

constexpr TableSlot kTables[] = {
    {&RTCSInfo_t::padfRangeCoefs, 3},    {&RTCSInfo_t::padfIncidenceCoefs, 3},
    {&RTCSInfo_t::padfPixelSpacing, 1},  {&RTCSInfo_t::padfQRangeFirst, 4},
    {&RTCSInfo_t::padfQRangeLast, 4},    {&RTCSInfo_t::padfQStepCoefs, 12},
    {&RTCSInfo_t::padfQAngleNearFar, 4}, {&RTCSInfo_t::padfQAngleFarSat, 4},
    {&RTCSInfo_t::padfQAngleNearSat, 4}, {&RTCSInfo_t::padfQUnitNear, 12},
    {&RTCSInfo_t::padfQUnitFar, 12},     {&RTCSInfo_t::padfQUnitSat, 12},
    {&RTCSInfo_t::padfQSatPos, 12},      {&RTCSInfo_t::padfQSatRadius, 4},
    {&RTCSInfo_t::padfQRadiusNear, 4},   {&RTCSInfo_t::padfQRadiusMid, 4},
    {&RTCSInfo_t::padfQRadiusFar, 4},
};

constexpr double* LinePosition::*kLineArrays[] = {
    &LinePosition::padfRangeFirst, &LinePosition::padfRangeLast, &LinePosition::padfLonFirst,
    &LinePosition::padfLonMid,     &LinePosition::padfLonLast,   &LinePosition::padfLatFirst,
    &LinePosition::padfLatMid,     &LinePosition::padfLatLast,
};

void FreeLineArrays(LinePosition& sLines) {
    for (double* LinePosition::*pArray : kLineArrays) FreeTable(sLines.*pArray);
}

void FreeDerivedTables(RTCSInfo_t* psModel) {
    for (const TableSlot& s : kTables) FreeTable(psModel->*s.pMember);
}

// Pixel of the parallax step. The per-line range and incidence are smooth
// quadratics of the pixel that hold well beyond the raster's edges, so a
// point is shifted by the parallax of its own position up to one raster
// width outside; only beyond that the nearest position of that band is used.
// (Taking the raster's edge pixel instead bends the mapping at the edges and
// misplaces points below the reference height near the near-range edge.)
double ParallaxPixel(double dfPixel, int nPixels) {
    return std::clamp(dfPixel, -static_cast<double>(nPixels), 2.0 * nPixels - 1.0);
}

void SetFailed(double* pdfA, double* pdfB) {
    *pdfA = LUMO_NULL_VALUE;
    *pdfB = LUMO_NULL_VALUE;
}

}  // namespace

std::string NormalisedHeightRef(const std::string& osRef) {
    std::string osUpper = osRef;
    for (char& c : osUpper) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
    return osUpper == "E" ? "E" : "M";
}

void FreeOptionBlock(RTCSCOpt_t* psOpt) {
    if (psOpt == nullptr) return;
    FreeLineArrays(psOpt->sLines);
    std::free(psOpt);
}

void AllocateDerivedTables(RTCSInfo_t* psModel) {
    FreeDerivedTables(psModel);
    const int nLines = psModel->psCOpt->sLines.nLines;
    if (nLines <= 0) return;
    for (const TableSlot& s : kTables) psModel->*s.pMember = NewTable(nLines, s.nPerLine);
}

void AllocateTables(RTCSInfo_t* psModel, int nLines) {
    LinePosition& sLines = psModel->psCOpt->sLines;
    FreeLineArrays(sLines);
    sLines.nLines = std::max(nLines, 0);
    AllocateDerivedTables(psModel);
    if (nLines <= 0) return;
    for (double* LinePosition::*pArray : kLineArrays) sLines.*pArray = NewTable(nLines, 1);
}

bool InRpcWindow(const RTCSInfo_t& sModel, double dfPixel, double dfLine) {
    constexpr double kMargin = 0.02;
    const LinePosition& s = sModel.psCOpt->sLines;
    return dfPixel >= -kMargin * s.nPixels && dfPixel <= (1.0 + kMargin) * s.nPixels &&
           dfLine >= -kMargin * s.nLines && dfLine <= (1.0 + kMargin) * s.nLines;
}

bool IsEvaluable(const RTCSInfo_t* psModel) {
    if (psModel == nullptr || psModel->psCOpt == nullptr) return false;
    const LinePosition& s = psModel->psCOpt->sLines;
    if (s.nLines < 1 || s.nPixels < 1) return false;
    for (const TableSlot& t : kTables) {
        if (psModel->*t.pMember == nullptr) return false;
    }
    return psModel->sGeoFwd.nFitKind != GCP_FIT_NONE && psModel->sGeoInv.nFitKind != GCP_FIT_NONE;
}

std::string CheckLinePositions(const LinePosition& s) {
    if (s.nLines < 1) return nova::FormatString("line count %d is below 1", s.nLines);
    if (s.nPixels < 1) return nova::FormatString("pixel count %d is below 1", s.nPixels);
    static const char* const kNames[] = {"RangeFirst", "RangeLast", "LonFirst", "LonMid",
                                         "LonLast",    "LatFirst",  "LatMid",   "LatLast"};
    for (int a = 0; a < 8; ++a) {
        const double* padf = s.*kLineArrays[a];
        if (padf == nullptr)
            return nova::FormatString("line positions have no %s array", kNames[a]);
        for (int i = 0; i < s.nLines; ++i) {
            if (!std::isfinite(padf[i])) {
                return nova::FormatString("%s of line %d is %g", kNames[a], i, padf[i]);
            }
        }
    }
    for (int i = 0; i < s.nLines; ++i) {
        if (!(s.padfRangeFirst[i] > 0.0) || !(s.padfRangeLast[i] > 0.0)) {
            return nova::FormatString("slant ranges of line %d (%g, %g) are not positive", i,
                                      s.padfRangeFirst[i], s.padfRangeLast[i]);
        }
        const double adfLat[3] = {s.padfLatFirst[i], s.padfLatMid[i], s.padfLatLast[i]};
        for (double dfLat : adfLat) {
            if (std::fabs(dfLat) > 90.0) {
                return nova::FormatString("latitude %g of line %d lies beyond 90 degrees", dfLat,
                                          i);
            }
        }
    }
    return std::string();
}

double LongitudeNear(double dfLon, double dfReference) {
    return dfReference + std::remainder(dfLon - dfReference, 360.0);
}

int TransformFromLongitude(const GEOInfo_t* psGeo, double dfLon, double dfLat, double* pdfOutX,
                           double* pdfOutY) {
    return GCPTransform(psGeo, LongitudeNear(dfLon, psGeo->dfInXOffset), dfLat, pdfOutX, pdfOutY);
}

bool OwnGeometryToImage(const RTCSInfo_t* psModel, double dfLon, double dfLat, double dfHeight,
                        double* pdfPixel, double* pdfLine, bool* pbClamped) {
    const LinePosition& s = psModel->psCOpt->sLines;
    double dfPixel = 0.0, dfLine = 0.0;
    if (TransformFromLongitude(&psModel->sGeoFwd, dfLon, dfLat, &dfPixel, &dfLine) != 0) {
        return false;
    }
    // The per-line tables exist for the raster's lines only: a line outside
    // takes the parallax of the nearest raster line (it varies slowly along
    // the track).
    const double dfParallaxPixel = ParallaxPixel(dfPixel, s.nPixels);
    const double dfParallaxLine = std::clamp(dfLine, 0.0, static_cast<double>(s.nLines - 1));
    if (pbClamped != nullptr) *pbClamped = dfParallaxPixel != dfPixel;
    const int nLine = static_cast<int>(std::floor(dfParallaxLine));
    double dfRange = 0, dfRaised = 0, dfIncidence = 0, dfAngle = 0, dfShift = 0;
    const double dh =
        EllipsoidalHeight(*psModel, dfLon, dfLat, dfHeight) - psModel->psCOpt->dfAvgHt;
    calculate_parallax_shift(nLine, psModel->nRangeDirection, psModel->padfPixelSpacing,
                             psModel->padfIncidenceCoefs, psModel->padfRangeCoefs, dh,
                             dfParallaxPixel, &dfRange, &dfRaised, &dfIncidence, &dfAngle,
                             &dfShift);
    *pdfPixel = dfPixel - dfShift;
    *pdfLine = dfLine;
    return std::isfinite(*pdfPixel) && std::isfinite(*pdfLine);
}

}  // namespace lumo::rtcs

using lumo::rtcs::AllocateTables;
using lumo::rtcs::IsEvaluable;

RTCSInfo_t::RTCSInfo_t()
    : sGcpProj{},
      psEphemeris(nullptr),
      sGeoFwd{},
      sGeoInv{},
      nNumPixels(0),
      nRangeDirection(1),
      nDownsample(1),
      dfPixelRes(1.0),
      dfLineRes(1.0),
      dfStartRangeFirst(1.0),
      dfStartRangeLast(1.0),
      dfMinGcpHeight(0.0),
      dfMaxGcpHeight(0.0),
      psCOpt(nullptr),
      poRpcModel(nullptr),
      padfRangeCoefs(nullptr),
      padfIncidenceCoefs(nullptr),
      padfPixelSpacing(nullptr),
      padfQRangeFirst(nullptr),
      padfQRangeLast(nullptr),
      padfQStepCoefs(nullptr),
      padfQAngleNearFar(nullptr),
      padfQAngleFarSat(nullptr),
      padfQAngleNearSat(nullptr),
      padfQUnitNear(nullptr),
      padfQUnitFar(nullptr),
      padfQUnitSat(nullptr),
      padfQSatPos(nullptr),
      padfQSatRadius(nullptr),
      padfQRadiusNear(nullptr),
      padfQRadiusMid(nullptr),
      padfQRadiusFar(nullptr) {
    try {
        psCOpt = static_cast<RTCSCOpt_t*>(HCalloc(1, sizeof(RTCSCOpt_t)));
        AllocateTables(this, 1);
    } catch (...) {
        // The destructor does not run for a constructor that throws.
        if (psCOpt != nullptr) AllocateTables(this, 0);
        lumo::rtcs::FreeOptionBlock(psCOpt);
        throw;
    }
}

RTCSInfo_t::~RTCSInfo_t() {
    LumoSatEphemerisFree(psEphemeris);
    // The derived tables belong to the model even when its option block was
    // handed to a container, so they are freed whether or not it is still here.
    lumo::rtcs::FreeDerivedTables(this);
    lumo::rtcs::FreeOptionBlock(psCOpt);
    delete poRpcModel;
}

RTCSInfo_t* RTCSAllocate() {
    try {
        return new RTCSInfo_t();
    } catch (...) {
        return nullptr;
    }
}

void RTCSFreeModel(RTCSInfo_t* psModel) {
    delete psModel;
}

void RTCSCopy(RTCSInfo_t* psDst, const RTCSInfo_t* psSrc) {
    if (psDst == nullptr || psSrc == nullptr || psDst == psSrc) return;
    psDst->vecGcps = psSrc->vecGcps;
    psDst->sGcpProj = psSrc->sGcpProj;
    psDst->osHeightRef = lumo::rtcs::NormalisedHeightRef(psSrc->osHeightRef);

    LumoSatEphemerisFree(psDst->psEphemeris);
    psDst->psEphemeris = nullptr;
    if (psSrc->psEphemeris != nullptr) {
        psDst->psEphemeris = EphemerisSegDuplicate(psSrc->psEphemeris);
    }
    delete psDst->poRpcModel;
    psDst->poRpcModel = nullptr;
    if (psSrc->poRpcModel != nullptr) {
        psDst->poRpcModel = static_cast<nova::mathmodel::RpcMathModel*>(psSrc->poRpcModel->Clone());
    }

    if (psDst->psCOpt == nullptr) {
        psDst->psCOpt = static_cast<RTCSCOpt_t*>(HCalloc(1, sizeof(RTCSCOpt_t)));
    }
    const int nLines = psSrc->psCOpt != nullptr ? psSrc->psCOpt->sLines.nLines : 0;
    AllocateTables(psDst, nLines);
    psDst->sGeoFwd = psSrc->sGeoFwd;
    psDst->sGeoInv = psSrc->sGeoInv;
    psDst->nNumPixels = psSrc->nNumPixels;
    psDst->nRangeDirection = psSrc->nRangeDirection;
    psDst->nDownsample = psSrc->nDownsample;
    psDst->dfPixelRes = psSrc->dfPixelRes;
    psDst->dfLineRes = psSrc->dfLineRes;
    psDst->dfStartRangeFirst = psSrc->dfStartRangeFirst;
    psDst->dfStartRangeLast = psSrc->dfStartRangeLast;
    psDst->dfMinGcpHeight = psSrc->dfMinGcpHeight;
    psDst->dfMaxGcpHeight = psSrc->dfMaxGcpHeight;
    psDst->sGeoid = psSrc->sGeoid;
    if (psSrc->psCOpt == nullptr) return;

    const auto nCount = static_cast<std::size_t>(std::max(nLines, 0));
    for (const lumo::rtcs::TableSlot& s : lumo::rtcs::kTables) {
        const double* padfFrom = psSrc->*s.pMember;
        if (padfFrom != nullptr && nCount > 0) {
            std::memcpy(psDst->*s.pMember, padfFrom, nCount * s.nPerLine * sizeof(double));
        }
    }
    RTCSCOpt_t& sDst = *psDst->psCOpt;
    const RTCSCOpt_t& sSrc = *psSrc->psCOpt;
    sDst.sProj = sSrc.sProj;
    sDst.sLines.nPixels = sSrc.sLines.nPixels;
    sDst.dfAvgHt = sSrc.dfAvgHt;
    for (double* LinePosition::*pArray : lumo::rtcs::kLineArrays) {
        if (sSrc.sLines.*pArray != nullptr && nCount > 0) {
            std::memcpy(sDst.sLines.*pArray, sSrc.sLines.*pArray, nCount * sizeof(double));
        }
    }
}

int RTCSGeo2Img(const RTCSInfo_t* psModel, double dfX, double dfY, double dfZ, double* pdfPixel,
                double* pdfLine) {
    if (psModel == nullptr || pdfPixel == nullptr || pdfLine == nullptr) return 0;
    const double dfHeight = dfZ == LUMO_NULL_VALUE ? 0.0 : dfZ;
    if (psModel->poRpcModel != nullptr && IsEvaluable(psModel) &&
        psModel->poRpcModel->GroundToImage(dfX, dfY, dfHeight, *pdfPixel, *pdfLine, false) == 0 &&
        lumo::rtcs::InRpcWindow(*psModel, *pdfPixel, *pdfLine)) {
        return 1;
    }
    if (!IsEvaluable(psModel) || !std::isfinite(dfX) || !std::isfinite(dfY) ||
        !std::isfinite(dfHeight) ||
        !lumo::rtcs::OwnGeometryToImage(psModel, dfX, dfY, dfHeight, pdfPixel, pdfLine, nullptr)) {
        lumo::rtcs::SetFailed(pdfPixel, pdfLine);
        return 0;
    }
    return 1;
}

int RTCSImg2Geo(const RTCSInfo_t* psModel, double dfPixel, double dfLine, double dfZ, double* pdfX,
                double* pdfY) {
    if (psModel == nullptr || pdfX == nullptr || pdfY == nullptr) return 0;
    if (psModel->poRpcModel != nullptr && IsEvaluable(psModel) &&
        lumo::rtcs::InRpcWindow(*psModel, dfPixel, dfLine) &&
        psModel->poRpcModel->ImageToGround(dfPixel, dfLine, dfZ, *pdfX, *pdfY, false) == 0) {
        return 1;
    }
    lumo::rtcs::SetFailed(pdfX, pdfY);
    if (dfZ == LUMO_NULL_VALUE || !IsEvaluable(psModel) || !std::isfinite(dfPixel) ||
        !std::isfinite(dfLine) || !std::isfinite(dfZ)) {
        return 0;
    }
    // The quarter-line intersection places a point along the track only as
    // well as the segment's rounded positions allow (several lines off where
    // the geometry is nearly planar); it is refined on the model's own
    // ground-to-image mapping and verified against it.
    if (lumo::rtcs::OwnImageToGround(psModel, dfPixel, dfLine, dfZ, pdfX, pdfY)) return 1;
    lumo::rtcs::SetFailed(pdfX, pdfY);
    const LinePosition& s = psModel->psCOpt->sLines;
    // Inside the raster a failed intersection is a failure; outside it the
    // position at the reference height is the model's answer.
    const bool bInside = std::trunc(dfPixel) > 0.0 && std::trunc(dfLine) > 0.0 &&
                         dfPixel < s.nPixels && dfLine < s.nLines;
    if (bInside) return 0;
    double dfLon = 0.0, dfLat = 0.0;
    if (GCPTransform(&psModel->sGeoInv, dfPixel, dfLine, &dfLon, &dfLat) != 0) return 0;
    *pdfX = std::remainder(dfLon, 360.0);
    *pdfY = dfLat;
    return 1;
}

int RTCSImg2GeoDem(const RTCSInfo_t* psModel, double dfPixel, double dfLine, double* pdfZ,
                   double* pdfX, double* pdfY) {
    if (pdfZ == nullptr) return 0;
    if (*pdfZ == LUMO_NULL_VALUE) *pdfZ = 0.0;
    return RTCSImg2Geo(psModel, dfPixel, dfLine, *pdfZ, pdfX, pdfY);
}
