#include "analysis/RealDoubleFFT.h"

#include <cmath>

#include "common/LogTags.h"

// Mixed-radix real forward transform; every table read goes through the guarded read of
// its table. The radix-3, radix-5 and general passes keep the classic column-major index
// arithmetic (1-based helpers) so that each line can be checked against its derivation;
// the radix-2 and radix-4 passes, which carry the 512-point transform, use 0-based
// offsets and read each entry once into a local.

namespace {

constexpr double kTwoPi = 6.283185307179586;

using Reader = WaveTable_Reader;

// The entries of a table from position off on, still guarded by the table's length.
Reader from(const WaveTable_Double& t, int off) {
    return Reader{t.length > 0 ? t.data + off : t.data, t.length};
}

// cc is (ido, l1, 2), ch is (ido, 2, l1).
template <typename R>
void radf2Body(int ido, int l1, R cc, double* ch, R wa1) {
    const int s = l1 * ido;  // distance between the two inputs
    for (int k = 0; k < l1; ++k) {
        const int a0 = k * ido, a1 = a0 + s;
        const int h0 = 2 * ido * k, h1 = h0 + ido;
        const double x0 = cc[a0], x1 = cc[a1];
        ch[h0] = x0 + x1;
        ch[h1 + ido - 1] = x0 - x1;
    }
    if (ido < 2) return;
    if (ido > 2) {
        for (int k = 0; k < l1; ++k) {
            const int a0 = k * ido, a1 = a0 + s;
            const int h0 = 2 * ido * k, h1 = h0 + ido;
            for (int p = 1; p < ido - 1; p += 2) {
                const int pc = ido - p - 2;  // mirrored position in the second half
                const double wr = wa1[p - 1], wi = wa1[p];
                const double re = cc[a1 + p], im = cc[a1 + p + 1];
                const double xr = cc[a0 + p], xi = cc[a0 + p + 1];
                const double tr2 = wr * re + wi * im;
                const double ti2 = wr * im - wi * re;
                ch[h0 + p + 1] = xi + ti2;
                ch[h1 + pc + 1] = ti2 - xi;
                ch[h0 + p] = xr + tr2;
                ch[h1 + pc] = xr - tr2;
            }
        }
        if (ido % 2 == 1) return;
    }
    for (int k = 0; k < l1; ++k) {
        const int a0 = k * ido, a1 = a0 + s;
        const int h0 = 2 * ido * k, h1 = h0 + ido;
        const double y0 = cc[a0 + ido - 1], y1 = cc[a1 + ido - 1];
        ch[h1] = -y1;
        ch[h0 + ido - 1] = y0;
    }
}

// cc is (ido, l1, 3), ch is (ido, 3, l1).
template <typename R>
void radf3Body(int ido, int l1, R cc, double* ch, R wa1, R wa2) {
    constexpr double taur = -0.5;
    constexpr double taui = 0.866025403784439;
    auto CC = [&](int i, int k, int j) { return cc[(i - 1) + ido * ((k - 1) + l1 * (j - 1))]; };
    auto CH = [&](int i, int j, int k) -> double& {
        return ch[(i - 1) + ido * ((j - 1) + 3 * (k - 1))];
    };
    for (int k = 1; k <= l1; ++k) {
        const double cr2 = CC(1, k, 2) + CC(1, k, 3);
        CH(1, 1, k) = CC(1, k, 1) + cr2;
        CH(1, 3, k) = taui * (CC(1, k, 3) - CC(1, k, 2));
        CH(ido, 2, k) = CC(1, k, 1) + taur * cr2;
    }
    if (ido == 1) return;
    const int idp2 = ido + 2;
    for (int k = 1; k <= l1; ++k) {
        for (int i = 3; i <= ido; i += 2) {
            const int ic = idp2 - i;
            const double dr2 = wa1[i - 3] * CC(i - 1, k, 2) + wa1[i - 2] * CC(i, k, 2);
            const double di2 = wa1[i - 3] * CC(i, k, 2) - wa1[i - 2] * CC(i - 1, k, 2);
            const double dr3 = wa2[i - 3] * CC(i - 1, k, 3) + wa2[i - 2] * CC(i, k, 3);
            const double di3 = wa2[i - 3] * CC(i, k, 3) - wa2[i - 2] * CC(i - 1, k, 3);
            const double cr2 = dr2 + dr3;
            const double ci2 = di2 + di3;
            CH(i - 1, 1, k) = CC(i - 1, k, 1) + cr2;
            CH(i, 1, k) = CC(i, k, 1) + ci2;
            const double tr2 = CC(i - 1, k, 1) + taur * cr2;
            const double ti2 = CC(i, k, 1) + taur * ci2;
            const double tr3 = taui * (di2 - di3);
            const double ti3 = taui * (dr3 - dr2);
            CH(i - 1, 3, k) = tr2 + tr3;
            CH(ic - 1, 2, k) = tr2 - tr3;
            CH(i, 3, k) = ti2 + ti3;
            CH(ic, 2, k) = ti3 - ti2;
        }
    }
}

// cc is (ido, l1, 4), ch is (ido, 4, l1).
template <typename R>
void radf4Body(int ido, int l1, R cc, double* ch, R wa1, R wa2, R wa3) {
    constexpr double hsqt2 = 0.7071067811865475;
    const int s = l1 * ido;  // distance between the four inputs
    for (int k = 0; k < l1; ++k) {
        const int a0 = k * ido, a1 = a0 + s, a2 = a1 + s, a3 = a2 + s;
        const int h0 = 4 * ido * k, h1 = h0 + ido, h2 = h1 + ido, h3 = h2 + ido;
        const double x0 = cc[a0], x1 = cc[a1], x2 = cc[a2], x3 = cc[a3];
        const double tr1 = x1 + x3;
        const double tr2 = x0 + x2;
        ch[h0] = tr1 + tr2;
        ch[h3 + ido - 1] = tr2 - tr1;
        ch[h1 + ido - 1] = x0 - x2;
        ch[h2] = x3 - x1;
    }
    if (ido < 2) return;
    if (ido > 2) {
        for (int k = 0; k < l1; ++k) {
            const int a0 = k * ido, a1 = a0 + s, a2 = a1 + s, a3 = a2 + s;
            const int h0 = 4 * ido * k, h1 = h0 + ido, h2 = h1 + ido, h3 = h2 + ido;
            for (int p = 1; p < ido - 1; p += 2) {
                const int pc = ido - p - 2;  // mirrored position in the second half
                const double w1r = wa1[p - 1], w1i = wa1[p];
                const double w2r = wa2[p - 1], w2i = wa2[p];
                const double w3r = wa3[p - 1], w3i = wa3[p];
                const double x0r = cc[a0 + p], x0i = cc[a0 + p + 1];
                const double x1r = cc[a1 + p], x1i = cc[a1 + p + 1];
                const double x2r = cc[a2 + p], x2i = cc[a2 + p + 1];
                const double x3r = cc[a3 + p], x3i = cc[a3 + p + 1];
                const double cr2 = w1r * x1r + w1i * x1i;
                const double ci2 = w1r * x1i - w1i * x1r;
                const double cr3 = w2r * x2r + w2i * x2i;
                const double ci3 = w2r * x2i - w2i * x2r;
                const double cr4 = w3r * x3r + w3i * x3i;
                const double ci4 = w3r * x3i - w3i * x3r;
                const double tr1 = cr2 + cr4;
                const double tr4 = cr4 - cr2;
                const double ti1 = ci2 + ci4;
                const double ti4 = ci2 - ci4;
                const double ti2 = x0i + ci3;
                const double ti3 = x0i - ci3;
                const double tr2 = x0r + cr3;
                const double tr3 = x0r - cr3;
                ch[h0 + p] = tr1 + tr2;
                ch[h3 + pc] = tr2 - tr1;
                ch[h0 + p + 1] = ti1 + ti2;
                ch[h3 + pc + 1] = ti1 - ti2;
                ch[h2 + p] = ti4 + tr3;
                ch[h1 + pc] = tr3 - ti4;
                ch[h2 + p + 1] = tr4 + ti3;
                ch[h1 + pc + 1] = tr4 - ti3;
            }
        }
        if (ido % 2 == 1) return;
    }
    for (int k = 0; k < l1; ++k) {
        const int a0 = k * ido, a1 = a0 + s, a2 = a1 + s, a3 = a2 + s;
        const int h0 = 4 * ido * k, h1 = h0 + ido, h2 = h1 + ido, h3 = h2 + ido;
        const int e = ido - 1;
        const double y0 = cc[a0 + e], y1 = cc[a1 + e], y2 = cc[a2 + e], y3 = cc[a3 + e];
        const double ti1 = -hsqt2 * (y1 + y3);
        const double tr1 = hsqt2 * (y1 - y3);
        ch[h0 + e] = tr1 + y0;
        ch[h2 + e] = y0 - tr1;
        ch[h1] = ti1 - y2;
        ch[h3] = ti1 + y2;
    }
}

// cc is (ido, l1, 5), ch is (ido, 5, l1).
template <typename R>
void radf5Body(int ido, int l1, R cc, double* ch, R wa1, R wa2, R wa3, R wa4) {
    constexpr double tr11 = 0.309016994374947;
    constexpr double ti11 = 0.951056516295154;
    constexpr double tr12 = -0.809016994374947;
    constexpr double ti12 = 0.587785252292473;
    auto CC = [&](int i, int k, int j) { return cc[(i - 1) + ido * ((k - 1) + l1 * (j - 1))]; };
    auto CH = [&](int i, int j, int k) -> double& {
        return ch[(i - 1) + ido * ((j - 1) + 5 * (k - 1))];
    };
    for (int k = 1; k <= l1; ++k) {
        const double cr2 = CC(1, k, 5) + CC(1, k, 2);
        const double ci5 = CC(1, k, 5) - CC(1, k, 2);
        const double cr3 = CC(1, k, 4) + CC(1, k, 3);
        const double ci4 = CC(1, k, 4) - CC(1, k, 3);
        CH(1, 1, k) = CC(1, k, 1) + cr2 + cr3;
        CH(ido, 2, k) = CC(1, k, 1) + tr11 * cr2 + tr12 * cr3;
        CH(1, 3, k) = ti11 * ci5 + ti12 * ci4;
        CH(ido, 4, k) = CC(1, k, 1) + tr12 * cr2 + tr11 * cr3;
        CH(1, 5, k) = ti12 * ci5 - ti11 * ci4;
    }
    if (ido == 1) return;
    const int idp2 = ido + 2;
    for (int k = 1; k <= l1; ++k) {
        for (int i = 3; i <= ido; i += 2) {
            const int ic = idp2 - i;
            const double dr2 = wa1[i - 3] * CC(i - 1, k, 2) + wa1[i - 2] * CC(i, k, 2);
            const double di2 = wa1[i - 3] * CC(i, k, 2) - wa1[i - 2] * CC(i - 1, k, 2);
            const double dr3 = wa2[i - 3] * CC(i - 1, k, 3) + wa2[i - 2] * CC(i, k, 3);
            const double di3 = wa2[i - 3] * CC(i, k, 3) - wa2[i - 2] * CC(i - 1, k, 3);
            const double dr4 = wa3[i - 3] * CC(i - 1, k, 4) + wa3[i - 2] * CC(i, k, 4);
            const double di4 = wa3[i - 3] * CC(i, k, 4) - wa3[i - 2] * CC(i - 1, k, 4);
            const double dr5 = wa4[i - 3] * CC(i - 1, k, 5) + wa4[i - 2] * CC(i, k, 5);
            const double di5 = wa4[i - 3] * CC(i, k, 5) - wa4[i - 2] * CC(i - 1, k, 5);
            const double cr2 = dr2 + dr5;
            const double ci5 = dr5 - dr2;
            const double cr5 = di2 - di5;
            const double ci2 = di2 + di5;
            const double cr3 = dr3 + dr4;
            const double ci4 = dr4 - dr3;
            const double cr4 = di3 - di4;
            const double ci3 = di3 + di4;
            CH(i - 1, 1, k) = CC(i - 1, k, 1) + cr2 + cr3;
            CH(i, 1, k) = CC(i, k, 1) + ci2 + ci3;
            const double tr2 = CC(i - 1, k, 1) + tr11 * cr2 + tr12 * cr3;
            const double ti2 = CC(i, k, 1) + tr11 * ci2 + tr12 * ci3;
            const double tr3 = CC(i - 1, k, 1) + tr12 * cr2 + tr11 * cr3;
            const double ti3 = CC(i, k, 1) + tr12 * ci2 + tr11 * ci3;
            const double tr5 = ti11 * cr5 + ti12 * cr4;
            const double ti5 = ti11 * ci5 + ti12 * ci4;
            const double tr4 = ti12 * cr5 - ti11 * cr4;
            const double ti4 = ti12 * ci5 - ti11 * ci4;
            CH(i - 1, 3, k) = tr2 + tr5;
            CH(ic - 1, 2, k) = tr2 - tr5;
            CH(i, 3, k) = ti2 + ti5;
            CH(ic, 2, k) = ti5 - ti2;
            CH(i - 1, 5, k) = tr3 + tr4;
            CH(ic - 1, 4, k) = tr3 - tr4;
            CH(i, 5, k) = ti3 + ti4;
            CH(ic, 4, k) = ti4 - ti3;
        }
    }
}

// General odd factor ip. The main table c is seen as cc (ido, ip, l1), c1 (ido, l1, ip)
// and c2 (idl1, ip); the second table h as ch (ido, l1, ip) and ch2 (idl1, ip). The input
// is read from h when ido is 1 and from c otherwise; the result is left in c.
template <typename R>
void radfgBody(int ido, int ip, int l1, int idl1, R cr, double* cw, R hr, double* hw, R wa) {
    auto CCw = [&](int i, int j, int k) -> double& {
        return cw[(i - 1) + ido * ((j - 1) + ip * (k - 1))];
    };
    auto C1 = [&](int i, int k, int j) { return cr[(i - 1) + ido * ((k - 1) + l1 * (j - 1))]; };
    auto C1w = [&](int i, int k, int j) -> double& {
        return cw[(i - 1) + ido * ((k - 1) + l1 * (j - 1))];
    };
    auto C2 = [&](int ik, int j) { return cr[(ik - 1) + idl1 * (j - 1)]; };
    auto C2w = [&](int ik, int j) -> double& { return cw[(ik - 1) + idl1 * (j - 1)]; };
    auto CH = [&](int i, int k, int j) { return hr[(i - 1) + ido * ((k - 1) + l1 * (j - 1))]; };
    auto CHw = [&](int i, int k, int j) -> double& {
        return hw[(i - 1) + ido * ((k - 1) + l1 * (j - 1))];
    };
    auto CH2 = [&](int ik, int j) { return hr[(ik - 1) + idl1 * (j - 1)]; };
    auto CH2w = [&](int ik, int j) -> double& { return hw[(ik - 1) + idl1 * (j - 1)]; };
    auto WA = [&](int m) { return wa[m - 1]; };

    const double arg = kTwoPi / ip;
    const double dcp = std::cos(arg);
    const double dsp = std::sin(arg);
    const int ipph = (ip + 1) / 2;
    const int ipp2 = ip + 2;
    const int idp2 = ido + 2;

    if (ido != 1) {
        for (int ik = 1; ik <= idl1; ++ik) CH2w(ik, 1) = C2(ik, 1);
        for (int j = 2; j <= ip; ++j)
            for (int k = 1; k <= l1; ++k) CHw(1, k, j) = C1(1, k, j);
        int is = -ido;
        for (int j = 2; j <= ip; ++j) {
            is += ido;
            for (int k = 1; k <= l1; ++k) {
                int idij = is;
                for (int i = 3; i <= ido; i += 2) {
                    idij += 2;
                    CHw(i - 1, k, j) = WA(idij - 1) * C1(i - 1, k, j) + WA(idij) * C1(i, k, j);
                    CHw(i, k, j) = WA(idij - 1) * C1(i, k, j) - WA(idij) * C1(i - 1, k, j);
                }
            }
        }
        for (int j = 2; j <= ipph; ++j) {
            const int jc = ipp2 - j;
            for (int k = 1; k <= l1; ++k) {
                for (int i = 3; i <= ido; i += 2) {
                    C1w(i - 1, k, j) = CH(i - 1, k, j) + CH(i - 1, k, jc);
                    C1w(i - 1, k, jc) = CH(i, k, j) - CH(i, k, jc);
                    C1w(i, k, j) = CH(i, k, j) + CH(i, k, jc);
                    C1w(i, k, jc) = CH(i - 1, k, jc) - CH(i - 1, k, j);
                }
            }
        }
    } else {
        for (int ik = 1; ik <= idl1; ++ik) C2w(ik, 1) = CH2(ik, 1);
    }
    for (int j = 2; j <= ipph; ++j) {
        const int jc = ipp2 - j;
        for (int k = 1; k <= l1; ++k) {
            C1w(1, k, j) = CH(1, k, j) + CH(1, k, jc);
            C1w(1, k, jc) = CH(1, k, jc) - CH(1, k, j);
        }
    }

    double ar1 = 1.0;
    double ai1 = 0.0;
    for (int l = 2; l <= ipph; ++l) {
        const int lc = ipp2 - l;
        const double ar1h = dcp * ar1 - dsp * ai1;
        ai1 = dcp * ai1 + dsp * ar1;
        ar1 = ar1h;
        for (int ik = 1; ik <= idl1; ++ik) {
            CH2w(ik, l) = C2(ik, 1) + ar1 * C2(ik, 2);
            CH2w(ik, lc) = ai1 * C2(ik, ip);
        }
        const double dc2 = ar1;
        const double ds2 = ai1;
        double ar2 = ar1;
        double ai2 = ai1;
        for (int j = 3; j <= ipph; ++j) {
            const int jc = ipp2 - j;
            const double ar2h = dc2 * ar2 - ds2 * ai2;
            ai2 = dc2 * ai2 + ds2 * ar2;
            ar2 = ar2h;
            for (int ik = 1; ik <= idl1; ++ik) {
                CH2w(ik, l) = CH2(ik, l) + ar2 * C2(ik, j);
                CH2w(ik, lc) = CH2(ik, lc) + ai2 * C2(ik, jc);
            }
        }
    }
    for (int j = 2; j <= ipph; ++j)
        for (int ik = 1; ik <= idl1; ++ik) CH2w(ik, 1) = CH2(ik, 1) + C2(ik, j);

    for (int k = 1; k <= l1; ++k)
        for (int i = 1; i <= ido; ++i) CCw(i, 1, k) = CH(i, k, 1);
    for (int j = 2; j <= ipph; ++j) {
        const int jc = ipp2 - j;
        const int j2 = j + j;
        for (int k = 1; k <= l1; ++k) {
            CCw(ido, j2 - 2, k) = CH(1, k, j);
            CCw(1, j2 - 1, k) = CH(1, k, jc);
        }
    }
    if (ido == 1) return;
    for (int j = 2; j <= ipph; ++j) {
        const int jc = ipp2 - j;
        const int j2 = j + j;
        for (int k = 1; k <= l1; ++k) {
            for (int i = 3; i <= ido; i += 2) {
                const int ic = idp2 - i;
                CCw(i - 1, j2 - 1, k) = CH(i - 1, k, j) + CH(i - 1, k, jc);
                CCw(ic - 1, j2 - 2, k) = CH(i - 1, k, j) - CH(i - 1, k, jc);
                CCw(i, j2 - 1, k) = CH(i, k, j) + CH(i, k, jc);
                CCw(ic, j2 - 2, k) = CH(i, k, jc) - CH(i, k, j);
            }
        }
    }
}

// Each pass tests the length of every table it reads once, on entry. When none is empty
// the body runs with readers that skip the repeated test (the guarded read can only yield
// the entry); otherwise it runs with the per-read guard and its ERROR lines.
bool nonEmpty(const Reader& r) { return r.length >= 1; }

// A table already found non-empty by the pass.
struct TestedReader {
    const double* data;
    double operator[](int i) const { return data[i]; }
};
TestedReader tested(const Reader& r) { return TestedReader{r.data}; }

void radf2(int ido, int l1, Reader cc, double* ch, Reader wa1) {
    if (nonEmpty(cc) && nonEmpty(wa1)) {
        radf2Body(ido, l1, tested(cc), ch, tested(wa1));
    } else {
        radf2Body(ido, l1, cc, ch, wa1);
    }
}

void radf3(int ido, int l1, Reader cc, double* ch, Reader wa1, Reader wa2) {
    if (nonEmpty(cc) && nonEmpty(wa1) && nonEmpty(wa2)) {
        radf3Body(ido, l1, tested(cc), ch, tested(wa1), tested(wa2));
    } else {
        radf3Body(ido, l1, cc, ch, wa1, wa2);
    }
}

void radf4(int ido, int l1, Reader cc, double* ch, Reader wa1, Reader wa2, Reader wa3) {
    if (nonEmpty(cc) && nonEmpty(wa1) && nonEmpty(wa2) && nonEmpty(wa3)) {
        radf4Body(ido, l1, tested(cc), ch, tested(wa1), tested(wa2), tested(wa3));
    } else {
        radf4Body(ido, l1, cc, ch, wa1, wa2, wa3);
    }
}

void radf5(int ido, int l1, Reader cc, double* ch, Reader wa1, Reader wa2, Reader wa3, Reader wa4) {
    if (nonEmpty(cc) && nonEmpty(wa1) && nonEmpty(wa2) && nonEmpty(wa3) && nonEmpty(wa4)) {
        radf5Body(ido, l1, tested(cc), ch, tested(wa1), tested(wa2), tested(wa3), tested(wa4));
    } else {
        radf5Body(ido, l1, cc, ch, wa1, wa2, wa3, wa4);
    }
}

// General odd factor; see radfgBody for the roles of the two tables.
void radfg(int ido, int ip, int l1, int idl1, WaveTable_Double& c, WaveTable_Double& h, Reader wa) {
    const Reader cr = from(c, 0);
    const Reader hr = from(h, 0);
    if (nonEmpty(cr) && nonEmpty(hr) && nonEmpty(wa)) {
        radfgBody(ido, ip, l1, idl1, tested(cr), c.data, tested(hr), h.data, tested(wa));
    } else {
        radfgBody(ido, ip, l1, idl1, cr, c.data, hr, h.data, wa);
    }
}

}  // namespace

RealDoubleFFT::RealDoubleFFT(int n_) : n(n_), wavetable(new WaveTable_Double(2 * n_ + 15)) {
    // A length below 2 has nothing to factorise (and 0 would never reduce).
    if (n < 2) return;
    WaveTable_Double& wt = *wavetable;
    const int ifac = 2 * n;  // n, nf, then the factors

    // Factorisation: 4 first, then 2 (moved to the front), 3, 5 and the odd numbers.
    int nl = n;
    int nf = 0;
    int j = 0;
    int ntry = 0;
    static const int kFirstTries[4] = {4, 2, 3, 5};
    while (nl != 1) {
        ntry = j < 4 ? kFirstTries[j] : ntry + 2;
        ++j;
        while (nl % ntry == 0) {
            ++nf;
            wt.set(ifac + 1 + nf, ntry);
            nl /= ntry;
            if (ntry == 2 && nf != 1) {
                for (int i = nf; i >= 2; --i) wt.set(ifac + 1 + i, wt.get(ifac + i));
                wt.set(ifac + 2, 2);
            }
        }
    }
    wt.set(ifac, n);
    wt.set(ifac + 1, nf);

    // Twiddles for every factor but the last, from entry n on.
    const double argh = kTwoPi / n;
    const int wa = n;
    int is = 0;
    int l1 = 1;
    for (int k1 = 1; k1 <= nf - 1; ++k1) {
        const int ip = static_cast<int>(wt.get(ifac + 1 + k1));
        int ld = 0;
        const int l2 = l1 * ip;
        const int ido = n / l2;
        for (int jj = 1; jj <= ip - 1; ++jj) {
            ld += l1;
            int i = is;
            const double argld = ld * argh;
            double fi = 0.0;
            for (int ii = 3; ii <= ido; ii += 2) {
                i += 2;
                fi += 1.0;
                const double a = fi * argld;
                wt.set(wa + i - 2, std::cos(a));
                wt.set(wa + i - 1, std::sin(a));
            }
            is += ido;
        }
        l1 = l2;
    }
}

RealDoubleFFT::~RealDoubleFFT() { wavetable.clear(); }

void RealDoubleFFT::forwardTransform(android::sp<WaveTable_Double> data) {
    if (data == nullptr) return;
    if (data->length != n) {
        METER_LOGD("[%s) The length of data can not match that of the wavetable");
    }
    // A table shorter than n cannot hold the transform: it is refused and left as it is.
    if (n < 1 || data->length < n) return;
    if (n == 1) return;

    android::sp<WaveTable_Double> work = new WaveTable_Double(n);
    const Reader wt = wavetable->reader();
    wt.copyTo(0, work->data, n);

    const int nf = static_cast<int>(wt[2 * n + 1]);
    if (nf < 1) return;

    WaveTable_Double& c = *data;
    WaveTable_Double& ch = *work;
    int na = 1;
    int l2 = n;
    int iw = 2 * n - 1;
    for (int k1 = 1; k1 <= nf; ++k1) {
        const int kh = nf - k1;
        const int ip = static_cast<int>(wt[2 * n + 2 + kh]);
        const int l1 = l2 / ip;
        const int ido = n / l2;
        const int idl1 = ido * l1;
        iw -= (ip - 1) * ido;
        na = 1 - na;
        WaveTable_Double& src = na == 0 ? c : ch;
        WaveTable_Double& dst = na == 0 ? ch : c;
        switch (ip) {
            case 4:
                radf4(ido, l1, from(src, 0), dst.data, from(*wavetable, iw),
                      from(*wavetable, iw + ido), from(*wavetable, iw + 2 * ido));
                break;
            case 2:
                radf2(ido, l1, from(src, 0), dst.data, from(*wavetable, iw));
                break;
            case 3:
                radf3(ido, l1, from(src, 0), dst.data, from(*wavetable, iw),
                      from(*wavetable, iw + ido));
                break;
            case 5:
                radf5(ido, l1, from(src, 0), dst.data, from(*wavetable, iw),
                      from(*wavetable, iw + ido), from(*wavetable, iw + 2 * ido),
                      from(*wavetable, iw + 3 * ido));
                break;
            default:
                if (ido == 1) na = 1 - na;
                if (na == 0) {
                    radfg(ido, ip, l1, idl1, c, ch, from(*wavetable, iw));
                    na = 1;
                } else {
                    radfg(ido, ip, l1, idl1, ch, c, from(*wavetable, iw));
                    na = 0;
                }
                break;
        }
        l2 = l1;
    }
    if (na == 1) return;
    ch.reader().copyTo(0, c.data, n);
}
