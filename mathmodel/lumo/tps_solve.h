// Fast solve of the thin plate spline system for well-placed control points.
#pragma once

namespace lumo {

// Solves the spline system of n >= 4 control points (xi[i], eta[i]) in
// normalised coordinates for the two right-hand sides vx and vy:
//   [K P; Pᵀ 0] [w; a] = [v; 0],  K(i, j) = U(|p_i - p_j|²),  P = [1 xi eta],
// into coef = [a0, a1, a2, w0 .. w(n-1)] (n + 3 values each). Uses the
// structure of the system (see tps_solve.cpp), so it is fast but needs
// distinct points that are not collinear. Returns false, with the outputs
// unspecified, when the points are too close to that (the caller then uses
// the rank-revealing solve), or when some point's residual stays above
// residualLimit after refinement, or when its memory (two n x n matrices)
// cannot be had. *pdfCondition receives the estimated
// condition number of the projected radial system. Reentrant.
bool SolveSplineStructured(int n, const double* xi, const double* eta, const double* vx,
                           const double* vy, double residualLimit, double* coefX, double* coefY,
                           double* pdfCondition);

}  // namespace lumo
