// Confidence: intervals and probabilities of the distributions that the questions need.

/** The logarithm of the gamma function for positive numbers (Lanczos, to 1e-14). */
function logGamma(x) {
  const terms = [76.18009172947146, -86.50532032941677, 24.01409824083091, -1.231739572450155,
    0.1208650973866179e-2, -0.5395239384953e-5];
  const base = x + 5.5;
  const sum = terms.reduce((total, term, index) => total + term / (x + 1 + index), 1.000000000190015);
  return (x + 0.5) * Math.log(base) - base + Math.log(2.5066282746310005 * sum / x);
}

/** The regularised incomplete beta function, by its continued fraction. */
function incompleteBeta(a, b, x) {
  if (x <= 0) return 0;
  if (x >= 1) return 1;
  if (x > (a + 1) / (a + b + 2)) return 1 - incompleteBeta(b, a, 1 - x);
  const front = Math.exp(logGamma(a + b) - logGamma(a) - logGamma(b) + a * Math.log(x) + b * Math.log1p(-x)) / a;
  const tiny = 1e-300;
  let c = 1;
  let d = 1 / (Math.abs(1 - (a + b) * x / (a + 1)) < tiny ? tiny : 1 - (a + b) * x / (a + 1));
  let fraction = d;
  for (let m = 1; m < 500; ++m) {
    for (const term of [m * (b - m) * x / ((a + 2 * m - 1) * (a + 2 * m)),
      -(a + m) * (a + b + m) * x / ((a + 2 * m) * (a + 2 * m + 1))]) {
      d = 1 / (1 + term * d || tiny);
      c = 1 + term / c || tiny;
      fraction *= c * d;
    }
    if (Math.abs(c * d - 1) < 1e-15) break;
  }
  return front * fraction;
}

/** The value below which a rising function is less than the target. */
function inverse(rising, target, low, high) {
  for (let step = 0; step < 200; ++step) {
    const middle = (low + high) / 2;
    if (rising(middle) < target) low = middle; else high = middle;
  }
  return (low + high) / 2;
}

/** The chance of a Student's t that is farther from 0. */
export const studentTwoSided = (t, freedom) => incompleteBeta(freedom / 2, 0.5, freedom / (freedom + t * t));

export const studentQuantile95 = freedom => inverse(t => -studentTwoSided(t, freedom), -0.05, 0, 1000);

export function normalQuantile(level) {
  // Student's distribution with so much freedom is the normal one to nine digits.
  const distance = inverse(t => -studentTwoSided(t, 1e10), -2 * Math.min(level, 1 - level), 0, 40);
  return level < 0.5 ? -distance : distance;
}

const Z95 = 1.959963984540054;

/** Wilson's 95 % interval of a share. */
function shareInterval(some, all) {
  const share = some / all;
  const square = Z95 * Z95;
  const centre = (share + square / (2 * all)) / (1 + square / all);
  const reach = Z95 / (1 + square / all) * Math.sqrt(share * (1 - share) / all + square / (4 * all * all));
  return { share, low: centre - reach, high: centre + reach };
}

/** The difference of two shares, the second less the first, with Newcombe's 95 % interval. */
export function shareDifference(some1, all1, some2, all2) {
  const first = shareInterval(some1, all1);
  const second = shareInterval(some2, all2);
  const difference = second.share - first.share;
  const pooled = (some1 + some2) / (all1 + all2);
  const error = Math.sqrt(pooled * (1 - pooled) * (1 / all1 + 1 / all2));
  return {
    difference,
    low: difference - Math.hypot(second.share - second.low, first.high - first.share),
    high: difference + Math.hypot(second.high - second.share, first.share - first.low),
    p: error > 0 ? studentTwoSided(difference / error, 1e10) : 1,
  };
}

/** The chance that of so many tosses at least as unequal numbers fall on the two sides. */
export function signTest(one, other) {
  const least = Math.min(one, other);
  if (one === other) return 1;
  return Math.min(1, 2 * incompleteBeta(one + other - least, least + 1, 0.5));
}

/**
 * Yuen's comparison of trimmed means, which few extreme devices do not move. A group is { devices, cut,
 * middle, least, greatest, sum, squares }: the sums are of differences from `middle`, over those kept
 * after `cut` devices went at either end, the least and the greatest of which is given.
 */
export function trimmedDifference(first, second) {
  const one = trimmed(first);
  const other = trimmed(second);
  const error = Math.sqrt(one.error + other.error);
  const difference = other.mean - one.mean;
  const means = { one: one.mean, other: other.mean, difference, error, moved: Math.max(one.moved, other.moved) };
  if (!(error > 0)) return { ...means, low: difference, high: difference, p: difference === 0 ? 1 : 0 };
  const freedom = error ** 4 / (one.error ** 2 / one.freedom + other.error ** 2 / other.freedom);
  const reach = studentQuantile95(freedom) * error;
  return { ...means, low: difference - reach, high: difference + reach, p: studentTwoSided(difference / error, freedom) };
}

function trimmed({ devices, cut, middle, least, greatest, sum, squares }) {
  const kept = devices - 2 * cut;
  const ends = [least - middle, greatest - middle];
  const mean = (sum + cut * (ends[0] + ends[1])) / devices;
  const deviations = squares + cut * (ends[0] ** 2 + ends[1] ** 2) - devices * mean * mean;
  return { mean: middle + sum / kept, error: Math.max(deviations, 0) / (kept * (kept - 1)), freedom: kept - 1, moved: (greatest - least) / kept };
}
