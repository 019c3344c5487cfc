// Radar model generation: checks the radar segment, fills the line
// positions, reconstructs the satellite for every quarter line, reduces the
// control points and fits the polynomials, derives the per-line range and
// incidence, and finally fits the host's rational polynomial model.
#include <algorithm>
#include <cmath>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "crs.h"
#include "errors.h"
#include "lumo_ephemeris.h"
#include "lumo_gcp.h"
#include "lumo_rtcs.h"
#include "rpc.h"
#include "rtcs_earth.h"
#include "rtcs_internal.h"
#include "runtime.h"

namespace {

using lumo::rtcs::ClampedAcos;
using lumo::rtcs::kDegToRad;

struct ModelDeleter {
    void operator()(RTCSInfo_t* p) const { RTCSFreeModel(p); }
};

// Cosines of a triangle built from measured lengths: rounding may push them
// just past 1; more than that means the lengths make no triangle.
constexpr double kCosineSlack = 1e-9;

bool AcosChecked(double dfCosine, double* pdfAngle) {
    if (!(std::fabs(dfCosine) <= 1.0 + kCosineSlack)) return false;
    *pdfAngle = ClampedAcos(dfCosine);
    return true;
}

// Raised sphere point of a geodetic latitude and longitude in degrees.
double RaisedPoint(double dfLatDeg, double dfLonDeg, double dfAvgHt, double* padfXYZ) {
    const double dfLat = dfLatDeg * kDegToRad;
    const double dfRadius = lumo::rtcs::EarthRadius(dfLat) + dfAvgHt;
    lumo::rtcs::SpherePoint(dfLat, dfLonDeg * kDegToRad, dfRadius, padfXYZ);
    return dfRadius;
}

// The satellite in the plane of a near point, a far point and the Earth's
// centre, from the two slant ranges (triangle near-far-satellite next to
// triangle near-far-centre), and its direction fixed by a third point.
struct LineGeometry {
    double adfUnit[3][3];  // near, middle, far
    double dfNearFar = 0.0;
    double dfFarSat = 0.0;
    double dfSatRadius = 0.0;
    double adfSatDir[3] = {0.0, 0.0, 0.0};
};

bool SolveSatellite(const double* pN, const double* pM, const double* pF, double rN, double rFar,
                    double RN, double RF, bool bClamp, LineGeometry& g) {
    const double d = RTCSVectorDistance(pF, pN);
    if (!(d > 0.0) || !(rFar > 0.0) || !(RF > 0.0)) return false;
    const double c1 = (rFar * rFar + d * d - rN * rN) / (2.0 * d * rFar);
    const double c2 = (RF * RF + d * d - RN * RN) / (2.0 * d * RF);
    double a1 = 0.0, a2 = 0.0;
    if (bClamp) {
        a1 = ClampedAcos(c1);
        a2 = ClampedAcos(c2);
    } else if (!AcosChecked(c1, &a1) || !AcosChecked(c2, &a2)) {
        return false;
    }
    g.dfSatRadius =
        std::sqrt(std::max(0.0, RF * RF + rFar * rFar - 2.0 * RF * rFar * std::cos(a1 + a2)));
    if (!(g.dfSatRadius > 0.0)) return false;
    const double c3 =
        (g.dfSatRadius * g.dfSatRadius + RF * RF - rFar * rFar) / (2.0 * g.dfSatRadius * RF);
    if (bClamp) {
        g.dfFarSat = ClampedAcos(c3);
    } else if (!AcosChecked(c3, &g.dfFarSat)) {
        return false;
    }
    const double* points[3] = {pN, pM, pF};
    for (int k = 0; k < 3; ++k) {
        double dfLength = 0.0;
        RTCSNormalize(points[k], g.adfUnit[k], &dfLength);
        if (!(dfLength > 0.0)) return false;
    }
    g.dfNearFar = ClampedAcos(lumo::rtcs::Dot(g.adfUnit[0], g.adfUnit[2]));
    const double dfMidFar = ClampedAcos(lumo::rtcs::Dot(g.adfUnit[1], g.adfUnit[2]));
    const double adfRhs[3] = {std::cos(g.dfFarSat - g.dfNearFar), std::cos(g.dfFarSat - dfMidFar),
                              std::cos(g.dfFarSat)};
    int nStatus = -1;
    RTCSSolveEqn(g.adfUnit[0], g.adfUnit[1], g.adfUnit[2], adfRhs, g.adfSatDir, &nStatus);
    if (nStatus != 0) return false;
    double dfLength = 0.0;
    RTCSNormalize(g.adfSatDir, g.adfSatDir, &dfLength);
    return dfLength > 0.0;
}

// Quadratic through three samples at the given pixels.
bool Quadratic(const double* padfPixels, double y0, double y1, double y2, double* padfCoefs) {
    const double y[3] = {y0, y1, y2};
    const int n = 3;
    int nStatus = -1;
    RTCSPolyCoef(padfPixels, y, padfCoefs, &n, &nStatus);
    return nStatus == 0;
}

void PrintLayoutProblem(const EphemerisSeg_t& s) {
    const auto above = [](int32_t v, std::uint32_t limit) {
        return static_cast<std::uint32_t>(v) > limit;
    };
    const char* pszText = nullptr;
    if (above(s.nPrefixBytes, 65536)) {
        pszText = "Number of Prefix Bytes is Invalid \n";
    } else if (above(s.nSuffixBytes, 65536)) {
        pszText = "Number of Suffix Bytes is Invalid \n";
    } else if (above(s.nBytesPerPixel, 4)) {
        pszText = "Number of Bytes Per Pixel is Invalid \n";
    } else if (s.nBytesPerRecord == 0 || above(s.nBytesPerRecord, 65536)) {
        pszText = "Number of Bytes Per Record is Invalid \n";
    }
    if (pszText != nullptr) lumo::PrintUserMessage(stdout, pszText);
}

const RadarData_t* RadarLines(const EphemerisSeg_t& s) {
    if (s.nOrbitType != EPH_ORBIT_RADAR || s.ppOrbitData == nullptr) return nullptr;
    return static_cast<const RadarData_t*>(*s.ppOrbitData);
}

void FillLinePositions(const RadarData_t& sRadar, LinePosition& sLines) {
    const auto wrap = [](float f) {
        const double v = f;
        return v > 180.0 ? v - 360.0 : v;
    };
    for (int k = 0; k < sLines.nLines; ++k) {
        const RadarLine_t& r = sRadar.pLinePositions[k];
        sLines.padfRangeFirst[k] = r.nRangeFirst;
        sLines.padfRangeLast[k] = r.nRangeLast;
        sLines.padfLonFirst[k] = wrap(r.fLonFirst);
        sLines.padfLonMid[k] = wrap(r.fLonMid);
        sLines.padfLonLast[k] = wrap(r.fLonLast);
        sLines.padfLatFirst[k] = r.fLatFirst;
        sLines.padfLatMid[k] = r.fLatMid;
        sLines.padfLatLast[k] = r.fLatLast;
    }
}

// Control points with the model's WGS 84 geographic coordinates.
struct ControlArrays {
    std::vector<double> lon, lat, height, pixel, line;
    double dfMin = 1e38;
    double dfMax = -1e38;
};

ControlArrays ConvertControlPoints(const RTCSInfo_t& sModel, int nPixels, int nLines) {
    std::vector<ControlPoint_t> aoPoints = sModel.vecGcps;
    for (std::size_t i = 0; i < aoPoints.size(); ++i) {
        const ControlPoint_t& p = aoPoints[i];
        const int nNumber = static_cast<int>(i) + 1;
        if (!(p.dfImageX >= 0.0 && p.dfImageX <= nPixels)) {
            lumo::FatalReal(lumo::Err::kImageRange, "X_img", p.dfImageX, nNumber);
        }
        if (!(p.dfImageY >= 0.0 && p.dfImageY <= nLines)) {
            lumo::FatalReal(lumo::Err::kImageRange, "Y_img", p.dfImageY, nNumber);
        }
    }
    ControlArrays c;
    if (aoPoints.empty()) return c;
    ConvertGcpsToWgs84Ell(sModel.sGcpProj, sModel.osHeightRef, aoPoints);
    for (const ControlPoint_t& p : aoPoints) {
        c.lon.push_back(p.dfGroundX);
        c.lat.push_back(p.dfGroundY);
        c.height.push_back(p.dfGroundZ);
        c.pixel.push_back(p.dfImageX);
        c.line.push_back(p.dfImageY);
        c.dfMin = std::min(c.dfMin, p.dfGroundZ);
        c.dfMax = std::max(c.dfMax, p.dfGroundZ);
    }
    return c;
}

// Without control points the segment's own line positions (first, middle
// and last pixel at the reference height) serve as control points.
ControlArrays LinePositionsAsControl(const LinePosition& s) {
    ControlArrays c;
    const int nStep = std::max(1, s.nLines / 1000);
    const double adfPixel[3] = {0.0, 0.5 * (s.nPixels - 1), s.nPixels - 1.0};
    for (int k = 0; k < s.nLines; k += nStep) {
        const double adfLon[3] = {s.padfLonFirst[k], s.padfLonMid[k], s.padfLonLast[k]};
        const double adfLat[3] = {s.padfLatFirst[k], s.padfLatMid[k], s.padfLatLast[k]};
        for (int j = 0; j < 3; ++j) {
            c.lon.push_back(adfLon[j]);
            c.lat.push_back(adfLat[j]);
            c.pixel.push_back(adfPixel[j]);
            c.line.push_back(k);
        }
    }
    return c;
}

}  // namespace

namespace lumo::rtcs {

std::string CheckRadarSegment(const EphemerisSeg_t* psSeg) {
    if (psSeg == nullptr) return "no segment";
    const EphemerisSeg_t& s = *psSeg;
    if (s.nNumLines < 1) return nova::FormatString("nNumLines %d is below 1", s.nNumLines);
    if (s.nNumPixels < 1) return nova::FormatString("nNumPixels %d is below 1", s.nNumPixels);
    if (!(s.dfPixelRes > 0.0) || !std::isfinite(s.dfPixelRes)) {
        return nova::FormatString("dfPixelRes %g is not a positive number", s.dfPixelRes);
    }
    if (!std::isfinite(s.dfLineRes))
        return nova::FormatString("dfLineRes %g is not finite", s.dfLineRes);
    if (!(std::fabs(s.dfAvgHeight) < 1e5)) {
        return nova::FormatString("dfAvgHeight %g is not a terrain height", s.dfAvgHeight);
    }
    const RadarData_t* psRadar = RadarLines(s);
    if (psRadar == nullptr) {
        return nova::FormatString("nOrbitType %d: the segment has no radar line table (kind 2)",
                                  s.nOrbitType);
    }
    if (psRadar->pLinePositions == nullptr || psRadar->nNumLinePositions < s.nNumLines) {
        return nova::FormatString(
            "the radar line table holds %d lines for nNumLines %d",
            psRadar->pLinePositions == nullptr ? 0 : psRadar->nNumLinePositions, s.nNumLines);
    }
    for (int k = 0; k < s.nNumLines; ++k) {
        const RadarLine_t& r = psRadar->pLinePositions[k];
        if (r.nRangeFirst <= 0 || r.nRangeLast <= 0) {
            return nova::FormatString("pLinePositions[%d]: slant ranges %d and %d must be positive",
                                      k, r.nRangeFirst, r.nRangeLast);
        }
        const float afLat[3] = {r.fLatFirst, r.fLatMid, r.fLatLast};
        const float afLon[3] = {r.fLonFirst, r.fLonMid, r.fLonLast};
        for (int j = 0; j < 3; ++j) {
            if (!(std::fabs(afLat[j]) <= 90.0f)) {
                return nova::FormatString("pLinePositions[%d]: latitude %g is not within +-90", k,
                                          static_cast<double>(afLat[j]));
            }
            if (!(std::fabs(afLon[j]) <= 360.0f)) {
                return nova::FormatString("pLinePositions[%d]: longitude %g is not within +-360", k,
                                          static_cast<double>(afLon[j]));
            }
        }
    }
    return std::string();
}

void BuildQuarterLines(RTCSInfo_t* psModel) {
    RTCSCOpt_t& sOpt = *psModel->psCOpt;
    const LinePosition& s = sOpt.sLines;
    const double dfRes = psModel->dfPixelRes;
    const double adfStepPixels[3] = {0.0, s.nPixels / 2.0, static_cast<double>(s.nPixels)};
    for (int k = 0; k < 4 * s.nLines; ++k) {
        double rF = 0.0, rL = 0.0, adfLat[3], adfLon[3];
        int nOutside = 0;
        RTCSGetPositionInfo(&s, s.nLines, k * 0.25, &rF, &rL, adfLat, adfLon, &nOutside);
        // Near end: the first pixel when the range grows along the line.
        const bool bFirstNear = rL > rF;
        const int iN = bFirstNear ? 0 : 2;
        const int iF = bFirstNear ? 2 : 0;
        double pN[3], pM[3], pF[3];
        const double RN = RaisedPoint(adfLat[iN], adfLon[iN], sOpt.dfAvgHt, pN);
        const double RM = RaisedPoint(adfLat[1], adfLon[1], sOpt.dfAvgHt, pM);
        const double RF = RaisedPoint(adfLat[iF], adfLon[iF], sOpt.dfAvgHt, pF);
        psModel->padfQRangeFirst[k] = rF;
        psModel->padfQRangeLast[k] = rL;
        psModel->padfQRadiusNear[k] = RN;
        psModel->padfQRadiusMid[k] = RM;
        psModel->padfQRadiusFar[k] = RF;

        double* padfStep = psModel->padfQStepCoefs + 3 * k;
        LineGeometry g;
        if (nOutside != 0 ||
            !SolveSatellite(pN, pM, pF, bFirstNear ? rF : rL, bFirstNear ? rL : rF, RN, RF, false,
                            g) ||
            !Quadratic(adfStepPixels, dfRes / RN, dfRes / RM, dfRes / RF, padfStep)) {
            padfStep[0] = RTCS_FAILED_QUARTER;
            continue;
        }
        psModel->padfQAngleNearFar[k] = g.dfNearFar;
        psModel->padfQAngleFarSat[k] = g.dfFarSat;
        psModel->padfQAngleNearSat[k] = g.dfFarSat - g.dfNearFar;
        psModel->padfQSatRadius[k] = g.dfSatRadius;
        for (int j = 0; j < 3; ++j) {
            psModel->padfQUnitNear[3 * k + j] = g.adfUnit[0][j];
            psModel->padfQUnitFar[3 * k + j] = g.adfUnit[2][j];
            psModel->padfQUnitSat[3 * k + j] = g.adfSatDir[j];
            psModel->padfQSatPos[3 * k + j] = g.dfSatRadius * g.adfSatDir[j];
        }
    }
}

void BuildLineParameters(RTCSInfo_t* psModel) {
    const RTCSCOpt_t& sOpt = *psModel->psCOpt;
    const int nLines = sOpt.sLines.nLines;
    const int nPixels = sOpt.sLines.nPixels;
    const double adfSample[3] = {1.0, nPixels / 2.0, static_cast<double>(nPixels)};
    std::vector<char> abGood(static_cast<std::size_t>(nLines), 0);
    int nLastGood = -1;
    for (int i = 0; i < nLines; ++i) {
        double adfLat[3], adfLon[3];
        bool bOk = true;
        for (int k = 0; k < 3 && bOk; ++k) {
            bOk = GCPTransform(&psModel->sGeoInv, adfSample[k], i, &adfLon[k], &adfLat[k]) == 0;
        }
        double adfSat[3], adfRadius[3], adfX[3], adfY[3], adfZ[3];
        int nStatus = -1;
        if (bOk) {
            RTCSCalParameters(psModel->padfQRangeFirst[4 * i], psModel->padfQRangeLast[4 * i],
                              sOpt.dfAvgHt, adfSat, adfLat, adfLon, adfRadius,
                              psModel->padfRangeCoefs + 3 * i, psModel->padfIncidenceCoefs + 3 * i,
                              adfX, adfY, adfZ, psModel->padfPixelSpacing + i, nPixels, &nStatus);
        }
        if (nStatus == 0) {
            abGood[static_cast<std::size_t>(i)] = 1;
            nLastGood = i;
        }
    }
    if (nLastGood < 0) {
        lumo::Fatal(lumo::Err::kComputation,
                    _("Radar model: the range and incidence of no image line can be derived "
                      "from the line positions and the control points."));
    }
    // A line whose geometry failed takes that of the nearest good line, so
    // that every line has finite parameters.
    int nNearest = -1;
    for (int i = 0; i < nLines; ++i) {
        if (abGood[static_cast<std::size_t>(i)] != 0) {
            nNearest = i;
            continue;
        }
        int nFrom = nNearest;
        for (int j = i + 1; j < nLines; ++j) {
            if (abGood[static_cast<std::size_t>(j)] != 0 && (nFrom < 0 || j - i < i - nFrom)) {
                nFrom = j;
                break;
            }
        }
        std::copy_n(psModel->padfRangeCoefs + 3 * nFrom, 3, psModel->padfRangeCoefs + 3 * i);
        std::copy_n(psModel->padfIncidenceCoefs + 3 * nFrom, 3,
                    psModel->padfIncidenceCoefs + 3 * i);
        psModel->padfPixelSpacing[i] = psModel->padfPixelSpacing[nFrom];
    }
}

void RTCSBuildRpcModel(RTCSInfo_t* psModel) {
    delete psModel->poRpcModel;
    psModel->poRpcModel = nullptr;
    const RTCSCOpt_t& sOpt = *psModel->psCOpt;
    const LinePosition& s = sOpt.sLines;
    const int nLast = s.nLines - 1;
    const double dfLowHeight = -sOpt.dfAvgHt - 500.0;
    const double dfHighHeight = 8000.0;
    // Ground extent of the corner pixels (longitudes taken continuously),
    // widened to where the corners lie at the lowest and highest heights of
    // the grid: a point below the reference height imaged at the raster's
    // edge lies outside the corners' box, and the model must answer there.
    const double dfLonRef = s.padfLonFirst[0];
    std::vector<double> adfLon = {dfLonRef, LongitudeNear(s.padfLonLast[0], dfLonRef),
                                  LongitudeNear(s.padfLonFirst[nLast], dfLonRef),
                                  LongitudeNear(s.padfLonLast[nLast], dfLonRef)};
    std::vector<double> adfLat = {s.padfLatFirst[0], s.padfLatLast[0], s.padfLatFirst[nLast],
                                  s.padfLatLast[nLast]};
    for (double dfHeight : {dfLowHeight, dfHighHeight}) {
        for (double dfLine : {0.0, static_cast<double>(nLast)}) {
            for (double dfPixel : {0.0, s.nPixels - 1.0}) {
                double dfLon = 0.0, dfLat = 0.0;
                if (!OwnImageToGround(psModel, dfPixel, dfLine, dfHeight, &dfLon, &dfLat)) continue;
                adfLon.push_back(LongitudeNear(dfLon, dfLonRef));
                adfLat.push_back(dfLat);
            }
        }
    }
    const auto [lonMin, lonMax] = std::minmax_element(adfLon.begin(), adfLon.end());
    const auto [latMin, latMax] = std::minmax_element(adfLat.begin(), adfLat.end());

    constexpr int kGrid = 100;
    constexpr int kHeights = 10;
    std::vector<double> vLat, vLon, vHeight, vLine, vPixel;
    const std::size_t nNodes = static_cast<std::size_t>(kGrid) * kGrid * kHeights;
    for (auto* v : {&vLat, &vLon, &vHeight, &vLine, &vPixel}) v->reserve(nNodes);
    for (int i = 0; i < kGrid; ++i) {
        const double dfLat = *latMin + (*latMax - *latMin) * i / (kGrid - 1);
        for (int j = 0; j < kGrid; ++j) {
            const double dfLon = *lonMin + (*lonMax - *lonMin) * j / (kGrid - 1);
            for (int k = 0; k < kHeights; ++k) {
                const double dfHeight =
                    dfLowHeight + (dfHighHeight - dfLowHeight) * k / (kHeights - 1);
                double dfPixel = 0.0, dfLine = 0.0;
                bool bClamped = false;
                if (!OwnGeometryToImage(psModel, dfLon, dfLat, dfHeight, &dfPixel, &dfLine,
                                        &bClamped) ||
                    bClamped || !InRpcWindow(*psModel, dfPixel, dfLine)) {
                    continue;
                }
                vLat.push_back(dfLat);
                vLon.push_back(dfLon);
                vHeight.push_back(dfHeight);
                vLine.push_back(dfLine);
                vPixel.push_back(dfPixel);
            }
        }
    }
    nova::ogc::CRSPtr poWgs84(
        nova::ogc::ProjectionEngine::GetCSAuthorityFactory(nova::ogc::kProjectionEngineProj)
            ->CreateWGS84Ellipsoidal());
    nova::mathmodel::RpcCoefCalculator oCalculator;
    oCalculator.SetReportingFlag(false);
    nova::mathmodel::RpcMathModel* poRpc = nullptr;
    if (oCalculator.CalcCoef(vLat, vLon, vHeight, vLine, vPixel, poWgs84.get(), poRpc) != 0) {
        LUMO_TRACE(1, "RTCSBuildRpcModel: no rational polynomial model: %s\n",
                   oCalculator.GetLastError().c_str());
        return;
    }
    poRpc->SetRasterDimensions(s.nPixels, s.nLines);
    psModel->poRpcModel = poRpc;
}

namespace {

struct OptionBlockFreer {
    void operator()(RTCSCOpt_t* p) const { lumo::rtcs::FreeOptionBlock(p); }
};

// Ground length of one pixel from the first and last pixel of the middle
// line (the option block of a container fit carries no pixel spacing).
double PixelSpacingOf(const LinePosition& s, double dfAvgHt) {
    const int k = s.nLines / 2;
    double a[3], b[3];
    const double ra = RaisedPoint(s.padfLatFirst[k], s.padfLonFirst[k], dfAvgHt, a);
    RaisedPoint(s.padfLatLast[k], s.padfLonLast[k], dfAvgHt, b);
    double ua[3], ub[3], dfLength = 0.0;
    RTCSNormalize(a, ua, &dfLength);
    RTCSNormalize(b, ub, &dfLength);
    return ra * ClampedAcos(lumo::rtcs::Dot(ua, ub)) / std::max(1, s.nPixels - 1);
}

}  // namespace

void FitFromImageDescription(RTCSInfo_t* psModel, RTCSCOpt_t* psOpt, int nPoints,
                             const double* padfX, const double* padfY, const double* padfHeight,
                             const double* padfPixel, const double* padfLine) {
    std::unique_ptr<RTCSCOpt_t, OptionBlockFreer> poOpt(psOpt);
    if (psOpt == nullptr) {
        lumo::Fatal(lumo::Err::kBadArgument,
                    _("TRNCalculate3D: a radar fit needs its RTCSCOpt_t image description."));
    }
    // Fitted into copies, so that a failed fit leaves the former model.
    GEOInfo_t sFwd{}, sInv{};
    RTCSCalculate(&sFwd, &sInv, &psOpt->sLines, nPoints, &psOpt->sProj, padfPixel, padfLine, padfX,
                  padfY, padfHeight, psOpt->dfAvgHt, psOpt->sLines.nPixels, psOpt->sLines.nLines);
    FreeOptionBlock(psModel->psCOpt);
    psModel->psCOpt = poOpt.release();
    delete psModel->poRpcModel;  // it described the former model
    psModel->poRpcModel = nullptr;
    psModel->sGeoFwd = sFwd;
    psModel->sGeoInv = sInv;
    const LinePosition& s = psModel->psCOpt->sLines;
    psModel->nNumPixels = s.nPixels;
    psModel->nRangeDirection = s.padfRangeLast[0] > s.padfRangeFirst[0] ? 1 : -1;
    psModel->dfPixelRes = PixelSpacingOf(s, psModel->psCOpt->dfAvgHt);
    psModel->dfStartRangeFirst = s.padfRangeFirst[0];
    psModel->dfStartRangeLast = s.padfRangeLast[0];
    AllocateDerivedTables(psModel);
    BuildQuarterLines(psModel);
    BuildLineParameters(psModel);
}

}  // namespace lumo::rtcs

void RTCSCalParameters(double dfRangeFirst, double dfRangeLast, double dfAvgHt, double* padfSatPos,
                       const double* padfLat, const double* padfLon, double* padfRadiusCoefs,
                       double* padfRangeCoefs, double* padfIncidenceCoefs, double* padfXCoefs,
                       double* padfYCoefs, double* padfZCoefs, double* pdfPixelSpacing, int nPixels,
                       int* pnStatus) {
    *pnStatus = -1;
    double p[3][3], R[3];
    for (int k = 0; k < 3; ++k) R[k] = RaisedPoint(padfLat[k], padfLon[k], dfAvgHt, p[k]);
    // Near end: the last pixel when the range shrinks along the line.
    const bool bLastNear = dfRangeLast < dfRangeFirst;
    const int iN = bLastNear ? 2 : 0;
    const int iF = bLastNear ? 0 : 2;
    const double rN = bLastNear ? dfRangeLast : dfRangeFirst;
    const double rFar = bLastNear ? dfRangeFirst : dfRangeLast;
    LineGeometry g;
    if (!SolveSatellite(p[iN], p[1], p[iF], rN, rFar, R[iN], R[iF], true, g)) {
        LUMO_TRACE(1, "Error in RTCSCalParameters RTCSSolveEqn\n");
        return;
    }
    double S[3];
    for (int j = 0; j < 3; ++j) S[j] = padfSatPos[j] = g.dfSatRadius * g.adfSatDir[j];
    *pdfPixelSpacing = R[1] * g.dfNearFar / nPixels;

    const double adfSample[3] = {1.0, nPixels / 2.0, static_cast<double>(nPixels)};
    double adfIncidence[3];
    for (int k = 0; k < 3; ++k) {
        const double toSat[3] = {S[0] - p[k][0], S[1] - p[k][1], S[2] - p[k][2]};
        double u[3], v[3], dfLength = 0.0;
        RTCSNormalize(toSat, u, &dfLength);
        RTCSNormalize(p[k], v, &dfLength);
        adfIncidence[k] = ClampedAcos(lumo::rtcs::Dot(u, v));
    }
    const bool bOk =
        Quadratic(adfSample, p[0][0], p[1][0], p[2][0], padfXCoefs) &&
        Quadratic(adfSample, p[0][1], p[1][1], p[2][1], padfYCoefs) &&
        Quadratic(adfSample, p[0][2], p[1][2], p[2][2], padfZCoefs) &&
        Quadratic(adfSample, R[0], R[1], R[2], padfRadiusCoefs) &&
        Quadratic(adfSample, dfRangeFirst, RTCSVectorDistance(S, p[1]), dfRangeLast,
                  padfRangeCoefs) &&
        Quadratic(adfSample, adfIncidence[0], adfIncidence[1], adfIncidence[2], padfIncidenceCoefs);
    if (!bOk || !(*pdfPixelSpacing > 0.0)) {
        LUMO_TRACE(1, "Error in RTCSCalParameters RTCSPolyCoef\n");
        return;
    }
    *pnStatus = 0;
}

RTCSInfo_t* RTCSGenModel(const EphemerisSeg_t* psSeg, const ProjInfo_t& sProj,
                         const std::string& osHeightRef,
                         const std::vector<ControlPoint_t>& aoGcps) {
    const std::string osProblem = lumo::rtcs::CheckRadarSegment(psSeg);
    if (!osProblem.empty()) {
        lumo::Fatal(lumo::Err::kBadArgument,
                    MkName("RTCSGenModel: bad radar segment: %s.", osProblem.c_str()));
    }
    std::unique_ptr<RTCSInfo_t, ModelDeleter> poModel(RTCSAllocate());
    if (!poModel) lumo::Fatal(lumo::Err::kBadArgument, _("RTCSGenModel: out of memory."));
    RTCSInfo_t& m = *poModel;
    m.vecGcps = aoGcps;
    m.sGcpProj = sProj;
    m.osHeightRef = lumo::rtcs::NormalisedHeightRef(osHeightRef);
    m.psEphemeris = EphemerisSegDuplicate(psSeg);

    const EphemerisSeg_t& s = *psSeg;
    m.dfPixelRes = s.dfPixelRes;
    m.dfLineRes = s.dfLineRes;
    m.psCOpt->dfAvgHt = s.dfAvgHeight;
    PrintLayoutProblem(s);
    lumo::rtcs::AllocateTables(&m, s.nNumLines);
    m.psCOpt->sLines.nPixels = s.nNumPixels;
    LinePosition& sLines = m.psCOpt->sLines;
    FillLinePositions(*RadarLines(s), sLines);
    if (lumo::TraceOn()) {
        lumo::Trace(1, lumo::rtcs::kTraceFile, __LINE__,
                    "RTCSIniMap RTCSModel->psCOpt->dfAvgHt=%f\n", m.psCOpt->dfAvgHt);
    }
    m.nRangeDirection = sLines.padfRangeLast[0] > sLines.padfRangeFirst[0] ? 1 : -1;
    if (m.osHeightRef == "M") lumo::rtcs::BuildGeoidGrid(&m);
    lumo::rtcs::BuildQuarterLines(&m);

    ControlArrays c = ConvertControlPoints(m, sLines.nPixels, sLines.nLines);
    const double dfMin = c.dfMin;
    const double dfMax = c.dfMax;
    if (c.lon.empty()) {
        c = LinePositionsAsControl(sLines);
        c.height.assign(c.lon.size(), m.psCOpt->dfAvgHt);
        c.dfMin = c.dfMax = m.psCOpt->dfAvgHt;
    }
    RTCSGeoToImg(&sLines, static_cast<int>(c.lon.size()), c.lat.data(), c.lon.data(),
                 c.height.data(), c.pixel.data(), c.line.data(), sLines.nPixels, sLines.nLines,
                 c.dfMin, c.dfMax, m.psCOpt->dfAvgHt, &m.sGeoFwd, &m.sGeoInv);
    lumo::rtcs::BuildLineParameters(&m);

    m.dfMinGcpHeight = dfMin;
    m.dfMaxGcpHeight = dfMax;
    m.dfStartRangeFirst = sLines.padfRangeFirst[0];
    m.dfStartRangeLast = sLines.padfRangeLast[0];
    m.nNumPixels = sLines.nPixels;
    Geosys2ProjInfo(&m.psCOpt->sProj, "LON", 0.0, 0.0, 1.0, 1.0);
    lumo::rtcs::RTCSBuildRpcModel(&m);
    return poModel.release();
}
