// Packed normal equations of the rigorous adjustment: rows are added as
// outer products straight into the upper triangle, and the augmented matrix
// is solved by an in-place Cholesky factorisation.
#include <algorithm>
#include <cmath>
#include <new>
#include <stdexcept>

#include "errors.h"
#include "runtime.h"
#include "srit/srit_internal.h"

namespace lumo {
namespace srit {

NormalEquations::NormalEquations(int nUnknowns)
    : m_nSize(nUnknowns + 1),
      m_adf(static_cast<std::size_t>(m_nSize) * (m_nSize + 1) / 2, 0.0),
      m_adfRow(static_cast<std::size_t>(m_nSize), 0.0),
      m_adfScale(static_cast<std::size_t>(m_nSize), 0.0) {}

void NormalEquations::Clear() {
    std::fill(m_adf.begin(), m_adf.end(), 0.0);
}

void NormalEquations::ClearRow() {
    std::fill(m_adfRow.begin(), m_adfRow.end(), 0.0);
}

// Only the non-zero elements are visited: a row of a block adjustment
// touches one or two image blocks of a long unknown vector.
void NormalEquations::AddRow(double dfMisclosure, double dfWeight) {
    const int n = m_nSize - 1;
    m_anNonZero.clear();
    for (int r = 0; r < n; ++r) {
        if (m_adfRow[r] == 0.0) continue;
        m_adfRow[r] *= dfWeight;
        m_anNonZero.push_back(r);
    }
    m_adfRow[n] = dfMisclosure * dfWeight;
    m_anNonZero.push_back(n);
    for (std::size_t a = 0; a < m_anNonZero.size(); ++a) {
        const int r = m_anNonZero[a];
        const double g = m_adfRow[r];
        if (g == 0.0) continue;
        double* pdf = &m_adf[Offset(r)];
        for (std::size_t b = a; b < m_anNonZero.size(); ++b) {
            const int c = m_anNonZero[b];
            pdf[c - r] += g * m_adfRow[c];
        }
    }
}

// A pivot counts as not positive also when rounding left a tiny positive
// remnant of a singular system (below 1e-12 of its diagonal element), which
// would otherwise give huge meaningless corrections.
bool NormalEquations::Solve(double* pdfX) {
    const int n = m_nSize - 1;
    std::fill(pdfX, pdfX + n, 0.0);
    for (int r = 0; r < n; ++r) m_adfScale[r] = m_adf[Offset(r)];
    for (int r = 0; r < n; ++r) {
        double* pdfRow = &m_adf[Offset(r)];
        const double dfPivot = pdfRow[0];
        if (!(dfPivot > 1e-12 * m_adfScale[r])) return false;
        const double dfRoot = std::sqrt(dfPivot);
        for (int c = r; c <= n; ++c) pdfRow[c - r] /= dfRoot;
        for (int i = r + 1; i <= n; ++i) {
            const double dfRi = pdfRow[i - r];
            if (dfRi == 0.0) continue;
            double* pdfI = &m_adf[Offset(i)];
            for (int j = i; j <= n; ++j) pdfI[j - i] -= dfRi * pdfRow[j - r];
        }
    }
    for (int r = n - 1; r >= 0; --r) {
        const double* pdfRow = &m_adf[Offset(r)];
        double dfSum = -pdfRow[n - r];
        for (int j = r + 1; j < n; ++j) dfSum -= pdfRow[j - r] * pdfX[j];
        pdfX[r] = dfSum / pdfRow[0];
    }
    return true;
}

std::unique_ptr<NormalEquations> MakeNormalEquations(int nUnknowns) {
    const unsigned long long nSize = static_cast<unsigned long long>(nUnknowns) + 1ULL;
    const unsigned long long nElements = nSize * (nSize + 1ULL) / 2ULL;
    try {
        return std::make_unique<NormalEquations>(nUnknowns);
    } catch (const std::bad_alloc&) {
    } catch (const std::length_error&) {
    }
    lumo::Fatal(
        lumo::Err::kComputation,
        MkName(_("SRIT adjustment: the normal matrix of %d unknowns (%llu values) cannot be "
                 "allocated.\n"),
               nUnknowns, nElements));
}

}  // namespace srit
}  // namespace lumo
