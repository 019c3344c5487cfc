// Rigorous model: why a record cannot be evaluated.
#include <cmath>
#include <string>

#include "lumo_ephemeris.h"
#include "lumo_srit.h"
#include "record_check.h"

namespace {

// c0 is twice the normal radius of curvature of the Earth ellipsoid at the
// scene: about 1.28e7 m on every Earth ellipsoid.
constexpr double kMinDoubleRadius = 1e7;
constexpr double kMaxDoubleRadius = 1.5e7;

// The coefficients the transforms divide by, and what each one holds.
struct Divisor {
    int nIndex;
    const char* pszHolds;
};
constexpr Divisor kDivisors[] = {
    {2, "the angle of one pixel"},
    {6, "cos(atan(P7))"},
    {11, "the ground distance per line"},
    {12, "the ground distance per unit of across-track angle"},
};

std::string Coefficient(int k) {
    return "adfCoef[" + std::to_string(k) + "]";
}

}  // namespace

std::string SRITValidate(const SRITInfo_t* psModel) {
    if (psModel == nullptr) return "the record is null";
    if (psModel->psEphemeris == nullptr) return "psEphemeris: the record has no segment";
    const double* c = psModel->adfCoef;
    std::string problem = lumo::FirstNonFinite("adfCoef", c, SRIT_NUM_COEFS);
    if (!problem.empty()) return problem;
    if (!(c[0] >= kMinDoubleRadius && c[0] <= kMaxDoubleRadius)) {
        return lumo::FieldProblem(Coefficient(0), c[0],
                                  "twice the Earth's radius of curvature lies within 1e7..1.5e7 m");
    }
    for (const Divisor& d : kDivisors) {
        if (c[d.nIndex] == 0.0) {
            return lumo::FieldProblem(Coefficient(d.nIndex), 0.0,
                                      std::string(d.pszHolds) + " must not be 0");
        }
    }
    if (!(c[6] > 0.0 && c[6] <= 1.0)) {
        return lumo::FieldProblem(Coefficient(6), c[6], "cos(atan(P7)) lies in (0, 1]");
    }
    const int32_t nForm = psModel->anAux[SRIT_AUX_FORM];
    if (nForm != SRIT_FORM_CLASSIC && nForm != SRIT_FORM_CURVED_INCIDENCE) {
        return lumo::FieldProblem("anAux[" + std::to_string(SRIT_AUX_FORM) + "]", nForm,
                                  "the model form is 0 (classic) or 1 (curved incidence)");
    }
    problem = EphemerisSegValidate(psModel->psEphemeris);
    return problem.empty() ? "" : "psEphemeris: " + problem;
}
