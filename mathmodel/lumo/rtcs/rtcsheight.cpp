// Radar control point height adjustment: nominal control points on a grid
// of rows (image lines) are moved along their line of constant slant range to
// a given height, and the point arrays are compacted, dropping points that
// cannot be moved.
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <string>
#include <vector>

#include "crs.h"
#include "dem.h"
#include "errors.h"
#include "lumo_rtcs.h"
#include "projection.h"
#include "rtcs_earth.h"
#include "runtime.h"

namespace {

constexpr int kMaxPasses = 6;
constexpr double kRowTolerance = 20.0;  // metres of slant range
constexpr int kDemCacheMegabytes = 10;

// The elevation model, its system and the transformation to it from the
// points' geographic system: the adjustment runs only when all three exist.
struct ElevationGate {
    nova::dem::DEMPtr poDem;
    nova::ogc::CRSPtr poFrom;
    nova::ogc::MathTransformPtr poTransform;
};

ElevationGate OpenGate(double dfSemiMajor, double dfSemiMinor) {
    const std::string osCode = EllipsoidInfoList::GetEllipsoidCode(dfSemiMajor, dfSemiMinor);
    char szGeosys[64];
    std::snprintf(szGeosys, sizeof szGeosys, "LON %s", osCode.empty() ? "D0" : osCode.c_str());
    DecodeGeosys(szGeosys, szGeosys);
    ElevationGate g;
    g.poDem.reset(nova::dem::DEMFactory::CreateGlobalDEM(false, kDemCacheMegabytes));
    if (!g.poDem || g.poDem->GetCRS() == nullptr) return g;
    ProjInfo_t sInfo{};
    if (Geosys2ProjInfo(&sInfo, szGeosys, 0.0, 0.0, 1.0, 1.0) < 0) return g;
    g.poFrom.reset(nova::ogc::utils::ProjInfoToCRS(sInfo));
    if (g.poFrom) {
        g.poTransform.reset(
            nova::ogc::utils::CreateCRSTransform(g.poFrom.get(), g.poDem->GetCRS(), 0.0));
    }
    return g;
}

void Require(bool bOk, const char* pszFormat, double a, double b, double c) {
    if (!bOk) lumo::Fatal(lumo::Err::kBadArgument, MkName(pszFormat, a, b, c));
}

}  // namespace

bool RTCSAdjustGCP(double dfHeight, double* padfPoint, const double* padfSatPos,
                   const double* padfAngles, const double* padfUnitSat, const double* padfUnit2,
                   const double* padfNormal, nova::dem::IRasterDEM* /*poDem*/,
                   nova::ogc::ct::IMathTransform* /*poTransform*/, const double* padfEll,
                   double dfTolerance) {
    double p0[3];
    RTCSGeodetic2XYZ(padfPoint, padfEll, p0);
    const double r = RTCSVectorDistance(padfSatPos, p0);
    const double dfSat = RTCSVectorLength(padfSatPos);
    double adfGeo[3] = {padfPoint[0], padfPoint[1], dfHeight};
    for (int nPass = 0; nPass < kMaxPasses; ++nPass) {
        double p[3];
        RTCSGeodetic2XYZ(adfGeo, padfEll, p);
        const double dfDelta = r - RTCSVectorDistance(padfSatPos, p);
        if (std::fabs(dfDelta) <= dfTolerance) {
            padfPoint[0] = adfGeo[0];
            padfPoint[1] = adfGeo[1];
            padfPoint[2] = dfHeight;
            return true;
        }
        // Angle at the Earth's centre between satellite and target, then the
        // direction at that angle in the plane of the row.
        const double dfLen = RTCSVectorLength(p);
        const double psi = RTCSInteriorAngle(dfSat, dfLen, r);
        const double adfRhs[3] = {std::cos(psi), std::cos(padfAngles[1] - psi), 0.0};
        double g[3];
        int nStatus = -1;
        RTCSSolveEqn(padfUnitSat, padfUnit2, padfNormal, adfRhs, g, &nStatus);
        if (nStatus != 0) return false;
        const double q[3] = {dfLen * g[0], dfLen * g[1], dfLen * g[2]};
        double adfNext[3];
        RTCSXYZ2Geodetic(q, padfEll, adfNext);
        if (!std::isfinite(adfNext[0]) || !std::isfinite(adfNext[1])) return false;
        adfGeo[0] = adfNext[0];
        adfGeo[1] = adfNext[1];
    }
    return false;
}

void RTCSAdjustGCPRowForElevation(double dfHeight, nova::dem::IRasterDEM* poDem,
                                  nova::ogc::ct::IMathTransform* poTransform,
                                  const double* padfPoint1, const double* padfPoint2,
                                  const double* padfEll, int nPoints, double* padfLon,
                                  double* padfLat, double* padfHeight) {
    double adfSat[3], adfAngles[2], adfUnit1[3], adfUnit2[3], adfNormal[3];
    if (!RTCSSatPositionAtLine(padfPoint1, padfPoint2, padfEll, adfSat, nullptr, adfAngles,
                               adfUnit1, adfUnit2, adfNormal)) {
        std::fill(padfHeight, padfHeight + std::max(nPoints, 0), LUMO_NULL_VALUE);
        return;
    }
    double adfUnitSat[3], dfLength = 0.0;
    RTCSNormalize(adfSat, adfUnitSat, &dfLength);
    for (int i = 0; i < nPoints; ++i) {
        double adfPoint[3] = {padfLon[i], padfLat[i], padfHeight[i]};
        if (RTCSAdjustGCP(dfHeight, adfPoint, adfSat, adfAngles, adfUnitSat, adfUnit2, adfNormal,
                          poDem, poTransform, padfEll, kRowTolerance)) {
            padfLon[i] = adfPoint[0];
            padfLat[i] = adfPoint[1];
            padfHeight[i] = adfPoint[2];
        } else {
            padfHeight[i] = LUMO_NULL_VALUE;
        }
    }
}

void RTCSAddElevationsToNominalGCPs(double dfHeight, int nRows, int nCols, double dfRangeFirst,
                                    double dfRangeLast, double dfSemiMajor, double dfSemiMinor,
                                    int* pnCount, int* panIds, double* padfA, double* padfB,
                                    double* padfC, double* padfLon, double* padfLat,
                                    double* padfHeight) {
    ElevationGate sGate = OpenGate(dfSemiMajor, dfSemiMinor);
    const int nEntries = *pnCount;
    *pnCount = 0;
    if (!sGate.poTransform || nCols < 2) return;
    Require(nRows >= 0 && static_cast<double>(nRows) * nCols <= nEntries,
            "RTCSAddElevationsToNominalGCPs: %g rows of %g points exceed the %g points given.",
            nRows, nCols, nEntries);
    Require(std::isfinite(dfHeight) && dfRangeFirst > 0.0 && dfRangeLast > 0.0,
            "RTCSAddElevationsToNominalGCPs: height %g and slant ranges %g, %g must be finite "
            "and the ranges positive.",
            dfHeight, dfRangeFirst, dfRangeLast);
    Require(dfSemiMajor > 0.0 && dfSemiMinor > 0.0 && dfSemiMinor <= dfSemiMajor,
            "RTCSAddElevationsToNominalGCPs: ellipsoid axes %g, %g (and %g) do not make an "
            "ellipsoid.",
            dfSemiMajor, dfSemiMinor, 0.0);

    double adfEll[RTCS_ELLIPSOID_SIZE] = {dfSemiMajor, dfSemiMinor};
    RTCSSetEllipsoidParameters(adfEll);
    const double dfNear = std::min(dfRangeFirst, dfRangeLast);
    const double dfFar = std::max(dfRangeFirst, dfRangeLast);
    const bool bFirstNear = dfRangeLast > dfRangeFirst;
    const auto nCols_ = static_cast<std::size_t>(nCols);
    std::vector<double> adfLon(nCols_), adfLat(nCols_), adfHeight(nCols_);
    for (int nRow = 0; nRow < nRows; ++nRow) {
        const std::size_t nBase = static_cast<std::size_t>(nRow) * nCols_;
        std::copy_n(padfLon + nBase, nCols_, adfLon.begin());
        std::copy_n(padfLat + nBase, nCols_, adfLat.begin());
        std::copy_n(padfHeight + nBase, nCols_, adfHeight.begin());
        const std::size_t iNear = bFirstNear ? 0 : nCols_ - 1;
        const std::size_t iFar = bFirstNear ? nCols_ - 1 : 0;
        const double adfPoint1[4] = {adfLon[iNear], adfLat[iNear], adfHeight[iNear], dfNear};
        const double adfPoint2[4] = {adfLon[iFar], adfLat[iFar], adfHeight[iFar], dfFar};
        RTCSAdjustGCPRowForElevation(dfHeight, sGate.poDem.get(), sGate.poTransform.get(),
                                     adfPoint1, adfPoint2, adfEll, nCols, adfLon.data(),
                                     adfLat.data(), adfHeight.data());
        std::copy(adfLon.begin(), adfLon.end(), padfLon + nBase);
        std::copy(adfLat.begin(), adfLat.end(), padfLat + nBase);
        std::copy(adfHeight.begin(), adfHeight.end(), padfHeight + nBase);
    }

    // Compaction: points keep their place and number until the first drop;
    // from then on every kept point moves forward and is numbered by its new
    // place, counted from 1.
    const int nPoints = nRows * nCols;
    int nKept = 0;
    bool bDropped = false;
    for (int i = 0; i < nPoints; ++i) {
        if (padfHeight[i] == LUMO_NULL_VALUE) {
            bDropped = true;
            continue;
        }
        if (bDropped) {
            for (double* padf : {padfA, padfB, padfC, padfLon, padfLat, padfHeight}) {
                padf[nKept] = padf[i];
            }
            panIds[nKept] = nKept + 1;
        }
        ++nKept;
    }
    *pnCount = nKept;
}
