// Block adjustment of several images: the identifiers of images and points,
// the control and tie observations with their checks, the image pairs, the
// driver that runs the one-image steps over the block, and the report of the
// points seen in more than one image.
#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstring>
#include <string>
#include <unordered_map>
#include <vector>

#include "errors.h"
#include "runtime.h"
#include "segment_access.h"
#include "srit/srit_internal.h"

namespace lumo {
namespace srit {
namespace {

// The block adjustment's debug messages name the entry points' source and
// these lines, whatever file they are written from.
constexpr const char* kEntrySource = "mathmodel/lumo/sritcalc_imp.cpp";
constexpr int kNotEnoughPointsLine = 1100;
constexpr int kSensorLine = 1268;

// An identifier of SRIT_ID_SIZE characters as a case-insensitive key.
std::string IdKey(const char* pszIds, int nIndex) {
    const char* psz = pszIds + static_cast<std::size_t>(nIndex) * SRIT_ID_SIZE;
    std::string osKey(psz, SRIT_ID_SIZE);
    for (char& c : osKey) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
    return osKey;
}

// The identifier as printable text (up to its first terminator, blanks trimmed).
std::string IdText(const char* pszIds, int nIndex) {
    const char* psz = pszIds + static_cast<std::size_t>(nIndex) * SRIT_ID_SIZE;
    std::size_t n = 0;
    while (n < SRIT_ID_SIZE && psz[n] != '\0') ++n;
    while (n > 0 && psz[n - 1] == ' ') --n;
    return std::string(psz, n);
}

double Optional(const double* padf, int i) {
    return padf != nullptr ? padf[i] : kNull;
}

// A coordinate must be a number; the null value means "not given" where the
// caller allows it.
void RequireCoordinate(double dfValue, bool bNullAllowed, const char* pszWhat, int nObservation,
                       const char* pszName) {
    if (std::isfinite(dfValue) && (bNullAllowed || dfValue != kNull)) return;
    lumo::Fatal(lumo::Err::kComputation,
                MkName(_("Block adjustment: %s observation %d has an invalid %s (%.17g).\n"),
                       pszWhat, nObservation, pszName, dfValue));
}

// The caller's arrays of one block adjustment.
struct BlockInput {
    int nImages;
    const char* pszImageIds;
    bool bImageFirst;
    EphemerisSeg_t** papsEphemeris;
    int nGCP;
    const char *pszGcpImageIds, *pszGcpPointIds, *pszGcpUsage;
    const double *padfA, *padfB, *padfZ, *padfSdA, *padfSdB, *padfSdZ;
    const double *padfC, *padfD, *padfSdC, *padfSdD;
    int nTie;
    const char *pszTieImageIds, *pszTiePointIds;
    const double *padfTiePixel, *padfTieLine;
    double* padfTieZ;
    const double *padfTieSdPixel, *padfTieSdLine, *padfTieSdZ;
};

// Image number of an observation's image identifier; an unknown identifier is
// a clear error.
std::size_t FindImage(const std::unordered_map<std::string, std::size_t>& mapImages,
                      const char* pszIds, int nIndex, const char* pszWhat) {
    const auto it = mapImages.find(IdKey(pszIds, nIndex));
    if (it != mapImages.end()) return it->second;
    lumo::Fatal(
        lumo::Err::kComputation,
        MkName(_("Block adjustment: %s observation %d names image \"%s\", which is not among "
                 "the images of the block.\n"),
               pszWhat, nIndex + 1, IdText(pszIds, nIndex).c_str()));
}

// Point record of an identifier, made on its first appearance.
PointRecord& FindPoint(Adjustment& sAdj, std::unordered_map<std::string, std::size_t>& mapPoints,
                       std::vector<int>& anFirstObservation, const std::string& osKey,
                       int nObservation) {
    const auto it = mapPoints.find(osKey);
    if (it != mapPoints.end()) return sAdj.asPoints[it->second];
    mapPoints.emplace(osKey, sAdj.asPoints.size());
    anFirstObservation.push_back(nObservation);
    sAdj.asPoints.emplace_back();
    PointRecord& sPoint = sAdj.asPoints.back();
    sPoint.asSlots.resize(sAdj.asImages.size());
    return sPoint;
}

// Control-point observations: points 0 ... G-1, with their types.
void AddControlObservations(Adjustment& sAdj, const BlockInput& in,
                            const std::unordered_map<std::string, std::size_t>& mapImages,
                            std::vector<int>& anFirstObservation) {
    std::unordered_map<std::string, std::size_t> mapPoints;
    const bool bF = in.bImageFirst;
    for (int i = 0; i < in.nGCP; ++i) {
        const int n = i + 1;
        const std::size_t k = FindImage(mapImages, in.pszGcpImageIds, i, "control-point");
        PointRecord& sPoint =
            FindPoint(sAdj, mapPoints, anFirstObservation, IdKey(in.pszGcpPointIds, i), i);
        ImageState& sImg = sAdj.asImages[k];
        PointSlot& sSlot = sPoint.asSlots[k];
        sPoint.nInUse = 1;
        sSlot.nFlag = in.pszGcpUsage[i] == 'A' ? 1 : 2;
        ++sImg.nObservations;
        sSlot.dfPixel = bF ? in.padfA[i] : in.padfC[i];
        sSlot.dfLine = bF ? in.padfB[i] : in.padfD[i];
        sPoint.dfX = bF ? in.padfC[i] : in.padfA[i];
        sPoint.dfY = bF ? in.padfD[i] : in.padfB[i];
        sPoint.dfZ = in.padfZ[i];
        RequireCoordinate(sSlot.dfPixel, false, "control-point", n, "pixel");
        RequireCoordinate(sSlot.dfLine, false, "control-point", n, "line");
        RequireCoordinate(sPoint.dfX, true, "control-point", n, "X");
        RequireCoordinate(sPoint.dfY, true, "control-point", n, "Y");
        RequireCoordinate(sPoint.dfZ, true, "control-point", n, "Z");
        const double dfSdPixel = Optional(bF ? in.padfSdA : in.padfSdC, i);
        const double dfSdLine = Optional(bF ? in.padfSdB : in.padfSdD, i);
        // Image standard deviations are given in pixels and kept in ground units.
        sSlot.dfSdPixel = dfSdPixel == kNull ? kNull : dfSdPixel * sImg.psSeg->dfPixelRes;
        sSlot.dfSdLine = dfSdLine == kNull ? kNull : dfSdLine * sImg.psSeg->dfLineRes;
        sPoint.dfSdX = Optional(bF ? in.padfSdC : in.padfSdA, i);
        sPoint.dfSdY = Optional(bF ? in.padfSdD : in.padfSdB, i);
        sPoint.dfSdZ = Optional(in.padfSdZ, i);
        const bool bPlan = sPoint.dfX != kNull && sPoint.dfY != kNull;
        if (bPlan && sPoint.dfZ != kNull) {
            sPoint.cType = 'X';
        } else if (bPlan) {
            sPoint.cType = 'P';
        } else {
            lumo::Fatal(lumo::Err::kComputation, MkName(_("GCP number %d has invalid type.\n"), n));
        }
        if (sImg.psSeg->nLevelConvForm > 0) {
            ConvertControlPointTo1A(in.papsEphemeris[k], &sSlot.dfPixel, &sSlot.dfLine);
        }
    }
}

// Tie observations: points G ... G+T-1. A tie point keeps an elevation once
// one of its observations has given it.
void AddTieObservations(Adjustment& sAdj, const BlockInput& in,
                        const std::unordered_map<std::string, std::size_t>& mapImages,
                        std::vector<std::size_t>& anTiePoint) {
    std::unordered_map<std::string, std::size_t> mapPoints;
    std::vector<int> anFirst;
    for (int i = 0; i < in.nTie; ++i) {
        const int n = i + 1;
        const std::size_t k = FindImage(mapImages, in.pszTieImageIds, i, "tie");
        const std::string osKey = IdKey(in.pszTiePointIds, i);
        const bool bNew = mapPoints.find(osKey) == mapPoints.end();
        PointRecord& sPoint = FindPoint(sAdj, mapPoints, anFirst, osKey, i);
        anTiePoint.push_back(static_cast<std::size_t>(&sPoint - sAdj.asPoints.data()));
        PointSlot& sSlot = sPoint.asSlots[k];
        if (bNew) sPoint.cType = 'H';
        sPoint.nInUse = 1;
        sSlot.nFlag = 1;
        sSlot.dfPixel = in.padfTiePixel[i];
        sSlot.dfLine = in.padfTieLine[i];
        RequireCoordinate(sSlot.dfPixel, false, "tie", n, "pixel");
        RequireCoordinate(sSlot.dfLine, false, "tie", n, "line");
        RequireCoordinate(in.padfTieZ[i], true, "tie", n, "elevation");
        sSlot.dfSdPixel = Optional(in.padfTieSdPixel, i);
        sSlot.dfSdLine = Optional(in.padfTieSdLine, i);
        if (in.padfTieZ[i] != kNull) {
            sPoint.dfZ = in.padfTieZ[i];
            sPoint.cType = 'A';
            const double dfSdZ = Optional(in.padfTieSdZ, i);
            if (dfSdZ != kNull) sPoint.dfSdZ = dfSdZ;
        }
        if (sAdj.asImages[k].psSeg->nLevelConvForm > 0) {
            ConvertControlPointTo1A(in.papsEphemeris[k], &sSlot.dfPixel, &sSlot.dfLine);
        }
    }
}

// Control points whose observation in an image enters the adjustment (a
// point measured twice in one image counts once: its slot holds one).
void CountUsedObservations(Adjustment& sAdj, std::size_t nControlPoints) {
    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        int nUsed = 0;
        for (std::size_t p = 0; p < nControlPoints; ++p) {
            nUsed += sAdj.asPoints[p].asSlots[k].nFlag == 1 ? 1 : 0;
        }
        sAdj.asImages[k].nUsedObservations = nUsed;
    }
}

// Every image needs 4 control-point observations (5 for radar).
bool EnoughPoints(const Adjustment& sAdj) {
    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        const ImageState& sImg = sAdj.asImages[k];
        const int nNeeded = SensorNameStartsWith(*sImg.psSeg, "SAR") ? 5 : 4;
        if (sImg.nObservations >= nNeeded) continue;
        if (lumo::TraceOn()) {
            lumo::Trace(1, kEntrySource, kNotEnoughPointsLine,
                        "Not enough points in image %d! no model calculated\n",
                        static_cast<int>(k));
        }
        return false;
    }
    return true;
}

// Pairs of images whose viewing-angle tangents differ by at least half the
// largest difference in the block.
void BuildPairs(Adjustment& sAdj) {
    const std::size_t n = sAdj.asImages.size();
    if (n < 2) return;
    double dfMax = 0.0;
    for (std::size_t i = 0; i < n; ++i) {
        for (std::size_t j = i + 1; j < n; ++j) {
            dfMax = std::max(dfMax, std::abs(std::tan(sAdj.asImages[i].psSeg->dfViewAngle) -
                                             std::tan(sAdj.asImages[j].psSeg->dfViewAngle)));
        }
    }
    for (std::size_t i = 0; i < n; ++i) {
        for (std::size_t j = i + 1; j < n; ++j) {
            const double dfDiff = std::abs(std::tan(sAdj.asImages[i].psSeg->dfViewAngle) -
                                           std::tan(sAdj.asImages[j].psSeg->dfViewAngle));
            if (dfDiff >= 0.5 * dfMax) sAdj.asPairs.push_back({i, j, dfDiff});
        }
    }
}

void RequireInput(const BlockInput& in, SRITInfo_t* const* papsModels) {
    RequireArgument(in.pszImageIds, "pszImageIds");
    RequireArgument(papsModels, "papsModels");
    RequireArgument(in.papsEphemeris, "papsEphemeris");
    RequireArgument(in.pszGcpImageIds, "pszGcpImageIds");
    RequireArgument(in.pszGcpPointIds, "pszGcpPointIds");
    RequireArgument(in.pszGcpUsage, "pszGcpUsage");
    RequireArgument(in.padfA, "padfA");
    RequireArgument(in.padfB, "padfB");
    RequireArgument(in.padfZ, "padfZ");
    RequireArgument(in.padfC, "padfC");
    RequireArgument(in.padfD, "padfD");
    if (in.nTie < 0)
        lumo::FatalReal(lumo::Err::kComputation, "Number of tie observations", in.nTie, 0);
    if (in.nTie == 1) {
        lumo::Fatal(lumo::Err::kComputation,
                    _("Block adjustment: a single tie observation ties nothing; a tie point needs "
                      "observations in at least two images.\n"));
    }
    if (in.nTie > 0) {
        RequireArgument(in.pszTieImageIds, "pszTieImageIds");
        RequireArgument(in.pszTiePointIds, "pszTiePointIds");
        RequireArgument(in.padfTiePixel, "padfTiePixel");
        RequireArgument(in.padfTieLine, "padfTieLine");
        RequireArgument(in.padfTieZ, "padfTieZ");
    }
    for (int k = 0; k < in.nImages; ++k) {
        RequireArgument(papsModels[k], "papsModels[k]");
        RequireArgument(in.papsEphemeris[k], "papsEphemeris[k]");
        CurvedIncidenceAsked(*papsModels[k], MkName("papsModels[%d]", k));
        for (int j = 0; j < k; ++j) {
            // Each record adopts its segment and releases the one it held:
            // a shared segment, or a record holding another image's new
            // segment, would be released while still in use.
            const bool bCrossed = papsModels[j]->psEphemeris == in.papsEphemeris[k] ||
                                  papsModels[k]->psEphemeris == in.papsEphemeris[j];
            if (papsModels[j] == papsModels[k] || in.papsEphemeris[j] == in.papsEphemeris[k] ||
                bCrossed) {
                lumo::Fatal(lumo::Err::kComputation,
                            MkName(_("Block adjustment: images %d and %d share a model record or a "
                                     "segment; each image needs its own.\n"),
                                   j, k));
            }
        }
    }
}

// Report of the control points measured in more than one image.
struct ReportOutputs {
    int* pnReported;
    char* pszIds;
    int* panImages;
    double *padfGivenX, *padfGivenY, *padfGivenZ;
    double *padfEstX, *padfEstY, *padfEstZ;
    double *padfResX, *padfResY, *padfResZ;
};

template <typename T>
void Put(T* pa, int i, T value) {
    if (pa != nullptr) pa[i] = value;
}

void WriteReport(const Adjustment& sAdj, std::size_t nControlPoints, const BlockInput& in,
                 const std::vector<int>& anFirstObservation, const ReportOutputs& out) {
    int nReported = 0;
    for (std::size_t p = 0; p < nControlPoints; ++p) {
        const PointRecord& sPoint = sAdj.asPoints[p];
        int nCount = 0;
        for (const PointSlot& sSlot : sPoint.asSlots) nCount += sSlot.nFlag != 0 ? 1 : 0;
        if (nCount <= 1) continue;
        if (out.pszIds != nullptr) {
            std::memcpy(
                out.pszIds + static_cast<std::size_t>(nReported) * SRIT_ID_SIZE,
                in.pszGcpPointIds + static_cast<std::size_t>(anFirstObservation[p]) * SRIT_ID_SIZE,
                SRIT_ID_SIZE);
        }
        Put(out.panImages, nReported, nCount);
        Put(out.padfGivenX, nReported, sPoint.dfX);
        Put(out.padfGivenY, nReported, sPoint.dfY);
        Put(out.padfGivenZ, nReported, sPoint.dfZ);
        Put(out.padfEstX, nReported, sPoint.dfEstX);
        Put(out.padfEstY, nReported, sPoint.dfEstY);
        Put(out.padfEstZ, nReported, sPoint.dfEstZ);
        Put(out.padfResX, nReported, sPoint.dfResX);
        Put(out.padfResY, nReported, sPoint.dfResY);
        Put(out.padfResZ, nReported, sPoint.dfResZ);
        ++nReported;
    }
    if (out.pnReported != nullptr) *out.pnReported = nReported;
}

}  // namespace

}  // namespace srit
}  // namespace lumo

int SRITCalculateMulti(int nImages, const char* pszImageIds, SRITInfo_t** papsModels,
                       bool bImageFirst, EphemerisSeg_t** papsEphemeris,
                       const ProjInfo_t* psProjInfo, int nGCP, const char* pszGcpImageIds,
                       const char* pszGcpPointIds, const char* pszGcpUsage, const double* padfA,
                       const double* padfB, const double* padfZ, const double* padfSdA,
                       const double* padfSdB, const double* padfSdZ, const double* padfC,
                       const double* padfD, const double* padfSdC, const double* padfSdD, int nTie,
                       const char* pszTieImageIds, const char* pszTiePointIds,
                       const double* padfTiePixel, const double* padfTieLine, double* padfTieZ,
                       const double* padfTieSdPixel, const double* padfTieSdLine,
                       const double* padfTieSdZ, double* padfTieX, double* padfTieY,
                       int* pnReported, char* pszReportedIds, int* panReportedImages,
                       double* padfGivenX, double* padfGivenY, double* padfGivenZ,
                       double* padfEstimatedX, double* padfEstimatedY, double* padfEstimatedZ,
                       double* padfResidualX, double* padfResidualY, double* padfResidualZ) {
    using namespace lumo::srit;
    if (nGCP < 3) return 0;
    // Checked before anything is allocated for the images.
    if (nImages > SRIT_MAX_IMAGES) {
        lumo::Fatal(lumo::Err::kBadArgument, _("Number of images has exceeded limit.\n"));
    }
    if (nImages < 1) lumo::FatalReal(lumo::Err::kComputation, "Number of images", nImages, 0);
    RequireArgument(psProjInfo, "psProjInfo");
    const BlockInput in{nImages,        pszImageIds,    bImageFirst, papsEphemeris, nGCP,
                        pszGcpImageIds, pszGcpPointIds, pszGcpUsage, padfA,         padfB,
                        padfZ,          padfSdA,        padfSdB,     padfSdZ,       padfC,
                        padfD,          padfSdC,        padfSdD,     nTie,          pszTieImageIds,
                        pszTiePointIds, padfTiePixel,   padfTieLine, padfTieZ,      padfTieSdPixel,
                        padfTieSdLine,  padfTieSdZ};
    RequireInput(in, papsModels);

    char szDecoded[NOVA_GEOSYS_LEN] = {};
    RequireConformal(*psProjInfo, szDecoded);
    Adjustment sAdj;
    sAdj.sEllipsoid = EllipsoidOf(*psProjInfo, szDecoded);

    sAdj.asImages.resize(static_cast<std::size_t>(nImages));
    std::unordered_map<std::string, std::size_t> mapImages;
    for (int k = 0; k < nImages; ++k) {
        sAdj.asImages[static_cast<std::size_t>(k)].psSeg = papsEphemeris[k];
        mapImages.emplace(IdKey(pszImageIds, k), static_cast<std::size_t>(k));  // first wins
    }
    std::vector<int> anFirstObservation;
    AddControlObservations(sAdj, in, mapImages, anFirstObservation);
    const std::size_t nControlPoints = sAdj.asPoints.size();
    std::vector<std::size_t> anTiePoint;
    AddTieObservations(sAdj, in, mapImages, anTiePoint);
    if (!EnoughPoints(sAdj)) return 0;
    CountUsedObservations(sAdj, nControlPoints);

    SpreadElevations(sAdj, nControlPoints);
    PrepareImages(sAdj);
    for (int k = 0; k < nImages; ++k) {
        sAdj.asImages[static_cast<std::size_t>(k)].sTerms.sSelect.bCurvedIncidence =
            papsModels[k]->anAux[SRIT_AUX_FORM] == SRIT_FORM_CURVED_INCIDENCE;
    }
    BuildPairs(sAdj);
    Adjust(sAdj, "SRITCalculateN");
    EstimatePoints(sAdj);

    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        FillRecord(sAdj.asImages[k], papsModels[k], papsEphemeris[k], *psProjInfo);
        if (lumo::TraceOn()) {
            const std::string osSensor(papsModels[k]->Sensor,
                                       strnlen(papsModels[k]->Sensor, SRIT_SENSOR_SIZE));
            lumo::Trace(1, kEntrySource, kSensorLine, "SRITModel[i]->Sensor=%s\n",
                        osSensor.c_str());
        }
    }
    for (int i = 0; i < nTie; ++i) {
        const PointRecord& sPoint = sAdj.asPoints[anTiePoint[static_cast<std::size_t>(i)]];
        if (padfTieX != nullptr) padfTieX[i] = sPoint.dfEstX;
        if (padfTieY != nullptr) padfTieY[i] = sPoint.dfEstY;
        padfTieZ[i] = sPoint.dfEstZ;
    }
    // Check observations join for the reported estimates.
    for (std::size_t p = 0; p < nControlPoints; ++p) {
        for (PointSlot& sSlot : sAdj.asPoints[p].asSlots) {
            if (sSlot.nFlag == 2) sSlot.nFlag = 1;
        }
    }
    EstimatePoints(sAdj);
    const ReportOutputs out{pnReported,     pszReportedIds, panReportedImages, padfGivenX,
                            padfGivenY,     padfGivenZ,     padfEstimatedX,    padfEstimatedY,
                            padfEstimatedZ, padfResidualX,  padfResidualY,     padfResidualZ};
    WriteReport(sAdj, nControlPoints, in, anFirstObservation, out);
    return 1;
}
