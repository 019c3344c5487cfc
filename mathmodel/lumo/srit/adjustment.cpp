// The rigorous adjustment's driver: the projection and ellipsoid checks, the
// fixed iterations with their parameter update, the filling of the model
// record, and the one-image computation.
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "errors.h"
#include "lumo_sensor.h"
#include "runtime.h"
#include "srit/srit_internal.h"

namespace lumo {
namespace srit {
namespace {

// Applies the corrections of the solution to every image's parameters.
void UpdateParameters(Adjustment& sAdj, const double* pdfX) {
    int nStart = 0;
    for (ImageState& sImg : sAdj.asImages) {
        const int* anPos = sImg.Positions();
        for (int p = 0; p < kMaxUnknowns; ++p) {
            if (anPos[p] >= sImg.sSetup.nUnknowns) continue;
            const double dfCorrection = pdfX[nStart + anPos[p]];
            if (p == kAcrossScale || p == kLineSpacing) {
                sImg.sTerms.P[p] *= 1.0 + dfCorrection;  // relative unknowns
            } else {
                sImg.sTerms.P[p] += dfCorrection;
            }
        }
        sImg.sTerms.UpdateDerived();
        nStart += sImg.sSetup.nUnknowns;
    }
}

// The fixed seven iterations: rows, constraints, solution, update, and the
// elevations of points without one re-estimated after each.
void RunIterations(Adjustment& sAdj) {
    int nUnknowns = 0;
    for (const ImageState& sImg : sAdj.asImages) nUnknowns += sImg.sSetup.nUnknowns;
    const std::unique_ptr<NormalEquations> psNormal = MakeNormalEquations(nUnknowns);
    NormalEquations& sNormal = *psNormal;
    std::vector<double> adfX(static_cast<std::size_t>(nUnknowns), 0.0);
    for (int nIteration = 0; nIteration < kIterations; ++nIteration) {
        sNormal.Clear();
        sAdj.dfMinControlWeight = 0.0;
        sAdj.dfLastRowWeight = 0.0;
        AddObservationRows(sAdj, sNormal);
        AddConstraintRows(sAdj, sNormal);
        if (!sNormal.Solve(adfX.data())) {
            LUMO_TRACE(1, "SRIT iteration %d: singular normal equations\n", nIteration + 1);
        }
        UpdateParameters(sAdj, adfX.data());
        EstimateElevations(sAdj, false);
    }
}
}  // namespace

void ReportNullArgument(const char* pszName) {
    lumo::Fatal(lumo::Err::kComputation,
                MkName(_("SRITCalculate: argument %s is null.\n"), pszName));
}

bool CurvedIncidenceAsked(const SRITInfo_t& sModel, const char* pszRecord) {
    const int32_t nForm = sModel.anAux[SRIT_AUX_FORM];
    if (nForm != SRIT_FORM_CLASSIC && nForm != SRIT_FORM_CURVED_INCIDENCE) {
        lumo::Fatal(lumo::Err::kBadArgument,
                    MkName(_("%s->anAux[%d] (the model form) is %d: it must be %d (classic) or %d "
                             "(curved incidence).\n"),
                           pszRecord, SRIT_AUX_FORM, static_cast<int>(nForm), SRIT_FORM_CLASSIC,
                           SRIT_FORM_CURVED_INCIDENCE));
    }
    return nForm == SRIT_FORM_CURVED_INCIDENCE;
}

// Ellipsoid of the control points' projection.
Ellipsoid EllipsoidOf(const ProjInfo_t& sProj, const char* pszDecoded) {
    double a = 0.0, b = 0.0;
    if (sProj.nEarthModelKind == NOVA_EARTH_SPHEROID_PARMS) {
        const int k = sProj.nSpheroid;
        if (k >= 0 && k <= 19 && sProj.adfProjParms[0] == 0.0) {
            int nCode = 0;
            GetEllipsoidData(MkName("E%03d", k), &nCode, &a, &b);
        } else {
            a = sProj.adfProjParms[0];
            const double s = sProj.adfProjParms[1];
            if (s > 1.0) {
                b = s;
            } else if (s > 0.0) {
                b = std::sqrt(a * a - s * a * a);
            } else if (s == 0.0) {
                b = a;
            } else {
                lumo::FatalReal(lumo::Err::kUnit, "Earth model", s, 2);
            }
        }
    } else {
        int nCode = 0;
        GetEllipsoidData(pszDecoded, &nCode, &a, &b);
    }
    if (!(a > 0.0) || !(b > 0.0) || !(b <= a) || !std::isfinite(a)) {
        lumo::FatalReal(lumo::Err::kUnit, "Earth model", a, 2);
    }
    return {a, (a * a - b * b) / (a * a)};
}

void RequireConformal(const ProjInfo_t& sProj, char* pszDecoded) {
    DecodeGeosys(sProj.szProj, pszDecoded);
    if (IsConformal(pszDecoded)) return;
    lumo::PrintUserMessage(stdout,
                           "Invalid GCP unit! Unit must be one of the following :\n"
                           "UTM, TM, LCC, PS, MER, METRE,\n"
                           "or the EPSG code of a conformal projection (EPSG:32631) \n");
    lumo::FatalChar(lumo::Err::kUnit, "GCP Unit", pszDecoded);
}

// Writes an image's result into its model record, which adopts the segment.
void FillRecord(const ImageState& sImg, SRITInfo_t* psModel, EphemerisSeg_t* psEphemeris,
                const ProjInfo_t& sProj) {
    StoreTerms(sImg.sTerms, psModel->adfCoef);
    // The line arrays describe the adopted segment only: arrays of an
    // earlier segment would not match its table.
    std::free(psModel->padfLineShiftB);
    std::free(psModel->padfLineShiftA);
    psModel->padfLineShiftB = nullptr;
    psModel->padfLineShiftA = nullptr;
    if (const AttitudeData_t* psTable = sImg.sTerms.psLineTable) {
        const auto n = static_cast<std::size_t>(psTable->nNumAttitudeLines);
        psModel->padfLineShiftB = static_cast<double*>(HMalloc(n * sizeof(double)));
        psModel->padfLineShiftA = static_cast<double*>(HMalloc(n * sizeof(double)));
        for (std::size_t i = 0; i < n; ++i) {
            psModel->padfLineShiftB[i] = psTable->pAttitudeLines[i].dfValue2;
            psModel->padfLineShiftA[i] = psTable->pAttitudeLines[i].dfValue1;
        }
    }
    std::memcpy(psModel->Sensor, sImg.sSetup.szShortName, SRIT_SENSOR_SIZE);
    psModel->nSensor = sImg.sSetup.nSensor;
    psModel->nModelClass = GetModel(sImg.sSetup.nSensor);
    if (psModel->psEphemeris != psEphemeris) {
        LumoSatEphemerisFree(psModel->psEphemeris);
        psModel->psEphemeris = psEphemeris;
    }
    if (psModel->psProjInfo == nullptr) {
        psModel->psProjInfo = static_cast<ProjInfo_t*>(HCalloc(1, sizeof(ProjInfo_t)));
    }
    if (psModel->psProjInfo != &sProj) *psModel->psProjInfo = sProj;
}

// Starting values, first elevations, the iterations, and a check that every
// image's parameters stayed numbers.
void Adjust(Adjustment& sAdj, const char* pszFunction) {
    ComputeStartingValues(sAdj);
    for (ImageState& sImage : sAdj.asImages) sImage.sTerms.UpdateDerived();
    EstimateElevations(sAdj, true);
    RunIterations(sAdj);
    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        for (int p = 0; p < kMaxUnknowns; ++p) {
            if (std::isfinite(sAdj.asImages[k].sTerms.P[p])) continue;
            lumo::Fatal(lumo::Err::kComputation,
                        MkName(_("%s: the adjustment of image %d diverged (parameter %d is not a "
                                 "number); check the control points.\n"),
                               pszFunction, static_cast<int>(k), p));
        }
    }
}

int CalculateOne(SRITInfo_t* psModel, bool bImageFirst, EphemerisSeg_t* psEphemeris, int nGCP,
                 const ProjInfo_t* psProjInfo, const double* padfA, const double* padfB,
                 const double* padfZ, const double* padfC, const double* padfD) {
    if (nGCP < 3) return 0;
    RequireArgument(psModel, "psModel");
    RequireArgument(psEphemeris, "psEphemeris");
    RequireArgument(psProjInfo, "psProjInfo");
    RequireArgument(padfA, "padfA");
    RequireArgument(padfB, "padfB");
    RequireArgument(padfZ, "padfZ");
    RequireArgument(padfC, "padfC");
    RequireArgument(padfD, "padfD");
    const bool bCurvedIncidence = CurvedIncidenceAsked(*psModel, "psModel");

    char szDecoded[NOVA_GEOSYS_LEN] = {};
    RequireConformal(*psProjInfo, szDecoded);
    Adjustment sAdj;
    sAdj.sEllipsoid = EllipsoidOf(*psProjInfo, szDecoded);

    sAdj.asImages.resize(1);
    ImageState& sImg = sAdj.asImages[0];
    sImg.psSeg = psEphemeris;

    // Control points: one full control point per observation, all in image 0.
    sAdj.asPoints.resize(static_cast<std::size_t>(nGCP));
    for (int i = 0; i < nGCP; ++i) {
        PointRecord& sPoint = sAdj.asPoints[static_cast<std::size_t>(i)];
        sPoint.cType = 'X';
        sPoint.nInUse = 1;
        sPoint.dfSdX = sPoint.dfSdY = sPoint.dfSdZ = 1.0;
        sPoint.asSlots.resize(1);
        PointSlot& sSlot = sPoint.asSlots[0];
        sSlot.nFlag = 1;
        sSlot.dfPixel = bImageFirst ? padfA[i] : padfC[i];
        sSlot.dfLine = bImageFirst ? padfB[i] : padfD[i];
        sPoint.dfX = bImageFirst ? padfC[i] : padfA[i];
        sPoint.dfY = bImageFirst ? padfD[i] : padfB[i];
        sPoint.dfZ = padfZ[i];
        const double adfValues[] = {sSlot.dfPixel, sSlot.dfLine, sPoint.dfX, sPoint.dfY,
                                    sPoint.dfZ};
        for (double dfValue : adfValues) {
            if (!std::isfinite(dfValue) || dfValue == kNull) {
                lumo::Fatal(lumo::Err::kComputation,
                            MkName(_("GCP number %d has an invalid coordinate (%.17g).\n"), i + 1,
                                   dfValue));
            }
        }
        if (psEphemeris->nLevelConvForm > 0) {
            ConvertControlPointTo1A(psEphemeris, &sSlot.dfPixel, &sSlot.dfLine);
        }
    }
    sImg.nObservations = nGCP;
    sImg.nUsedObservations = nGCP;
    SpreadElevations(sAdj, sAdj.asPoints.size());
    PrepareImages(sAdj);
    sImg.sTerms.sSelect.bCurvedIncidence = bCurvedIncidence;
    Adjust(sAdj, "SRITCalculate");
    FillRecord(sAdj.asImages[0], psModel, psEphemeris, *psProjInfo);
    return 1;
}

}  // namespace srit
}  // namespace lumo
