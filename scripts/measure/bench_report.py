# SPDX-License-Identifier: Apache-2.0
"""Writes docs/performance.md and its two charts from the results of scripts/measure/bench, which calls this with --write."""
import collections
import itertools
import os
import pathlib
import re
import subprocess

ROOT = pathlib.Path(__file__).resolve().parents[2]
DOCS = ROOT / "docs"
FEATURES = ("ssse3", "sse4_1", "avx2", "avx512f", "sha_ni", "aes")
PACKAGES = ("g++", "libc6", "libssl3", "libnettle8", "libcrypt1")

# What the first chart shows of verification: the scheme, our work and the peer's.
VERIFICATION = [("{SHA}", "sha-verify/ours", "sha-verify/openssl"),
                ("{SSHA}", "ssha-verify/ours", "ssha-verify/openssl"),
                ("{MD5}", "md5-verify/ours", "md5-verify/openssl"),
                ("{AES256}", "aes256-verify/ours", "aes256-verify/openssl"),
                ("{qVEIL}", "qveil-verify/ours", None),
                ("{crypt}", "crypt/ours", "crypt/libxcrypt")]
UNIT = "sha-verify/openssl"
THREADS = ("1", "2", "4")

# What the profile of a row over its bar shows, and what was tried. Shares are of processor cycles, by perf.
MISSED = {
    "ssha-verify": "OpenSSL's SHA-1 and its dispatch functions take 42 %, the provider's ten entries 28 % (some 3 ns each), "
                   "the library 23 %, libc 7 %; which entries are called is promised. Tried: a digest keeps the start that "
                   "the wipe before it made (5 %), base64 in vectors, buffers that are not cleared, no search for a scheme.",
    "md5-format": "OpenSSL's MD5, for which processors have no instructions and which the peer runs too, takes 59 %, the "
                  "library 17 %, the provider 15 %, libc 9 %, most of it the promised clearing of the caller's buffer. "
                  "Tried: the same as for `{SSHA}`.",
    "aes256-format": "OpenSSL takes 52 %, a part of it the overwriting of the key schedule after use, the library 21 %, the "
                     "provider 18 %, libc 8 %, most of it the promised clearing of the caller's buffer. Tried: base64 in "
                     "vectors, buffers that are not cleared.",
    "aes256-reveal": "As when it is made; the clear text is allocated and the padding checked. Tried: the same.",
    "crypt-verify": "All work is under the one lock that the shared state needs, so 1.00 is the most that there can be; "
                    "handing the lock over takes the rest. In a run at ordinary priority it was 0.94.",
    "command-format": "Of some 3 ms a sixth is the start of the process, a sixth the loader and the command line, two fifths "
                      "OpenSSL's relocations and start, a quarter the values, half of which is the system's generator. "
                      "Tried: the C++ runtime linked in, a start without OpenSSL's list of names, a smaller buffer.",
    "ldif-rotation": "A value is opened, made and checked by the server's own check: three AES operations are over half of "
                     "the time, the rest is spread over the reading and writing of lines. Tried: lines counted by vectors, "
                     "base64 digits from a table, attribute types kept, the key first that opened the last value.",
}

TEXT = """# Performance

Written by `scripts/measure/bench --write`; not to be edited.

Each figure is our time as a multiple of the time that a peer takes for the same work in the same run; a bar is what the
ratio must keep to. Where threads are compared it is the throughput of two over that of one. Absolute times are left
out: they say more about a machine than about a program. The last column is the 32-bit build beside 32-bit peers; it
has no bars.

{tables}
## Bars that are missed

{missed}
## Charts

![Time of a verification by scheme and peer](performance-verify.svg)

![Throughput of verification by the number of threads](performance-threads.svg)

## How it is measured

- One process calls the library, through its public interface, and its peers. The peers are called as a careful program
  calls them: algorithms are fetched once, a new context is made for each call unless the table says otherwise, results
  on the heap are allocated as ours are. Passwords have 16 bytes.
- All works take turns in random order, {repetitions} times each (Google Benchmark, random interleaving); the medians are
  compared. Work on one thread is taken in processor time. Of threads it is real time and the best repetition, since
  anything else that runs on one of the cores would decide the median; on a busy machine they are measured by a process
  of real-time priority (`chrt -f 10`). The works of a section share a run; sections may be measured after each other.
- Loading is measured in new processes, each of which reports its processor time from opening the library to its first
  value.
- Ratios are not tested for: a busy machine would decide. What the continuous integration compares are the instructions
  that the library's own objects execute for a call, which repeat: `bench/counts.csv`, `scripts/measure/bench --counts`.
  They are counted under valgrind, which knows no SHA extensions, so that they are those of the plain SHA-1.
- Processor features are chosen at run time: the SHA extensions for SHA-1, SSE4.1 for base64. Without them the plain
  code runs, which the tests compare with the other.
- The rows are in `bench/*_bench.cpp`, the bars in `bench/bars.csv`.

## This run

{machine}
"""


def table(results, narrow):
    rows = ["| work | against | ratio | bar | | 32 bits |", "| --- | --- | ---: | ---: | --- | ---: |"]
    for result in results:
        other = narrow.get((result.line["row"], result.line["peer"]))
        rows.append("| %s | %s | %.2f | %s | %s | %s |" % (
            result.line["work"], result.line["against"], result.ratio, result.bar(), result.verdict(),
            "" if other is None else "%.2f" % other))
    return "\n".join(rows) + "\n"


def missed(results):
    """What is known of each row over its bar; rows of one work share an entry."""
    rows = collections.defaultdict(list)
    for result in results:
        if result.verdict() == "missed":
            rows[result.line["row"]].append(result)
    return "\n".join("- %s: %s (%s). %s" % (
        found[0].line["work"], " and ".join("%.2f" % result.ratio for result in found), found[0].bar(),
        MISSED.get(row, "Not looked into.")) for row, found in rows.items()) + "\n"


def machine():
    info = pathlib.Path("/proc/cpuinfo").read_text()
    flags = re.search(r"flags\s*: (.*)", info)[1].split()
    model = re.search(r"model name\s*: (.*)", info)[1]
    family = re.search(r"cpu family\s*: (.*)", info)[1]
    versions = subprocess.run(["dpkg-query", "-W", "-f", "${Package} ${Version}\n", *PACKAGES], check=True,
                              stdout=subprocess.PIPE, text=True).stdout.split("\n")[:-1]
    return "\n".join(["- processor: %s (family %s), %d of its cores" % (model, family, os.cpu_count()),
                      "- features: " + ", ".join(feature for feature in FEATURES if feature in flags),
                      "- packages: " + ", ".join(versions)])


def plot(name, title, commands):
    head = ['set terminal svg size 760,380 font "sans-serif,13" background "white"',
            'set output "%s"' % (DOCS / name), 'set title "%s" noenhanced' % title, "set border 3", "set tics nomirror",
            'set grid y linecolor "#dddddd"', "set key noenhanced"]
    subprocess.run(["gnuplot"], check=True, text=True, input="\n".join(head + commands) + "\n")


def plot_verification(medians):
    rows = []
    for scheme, ours, peer in VERIFICATION:
        values = ["%.2f" % (medians[key] / medians[UNIT]) if key in medians else "NaN" for key in (ours, peer)]
        rows.append('"%s" %s' % (scheme, " ".join(values)))
    plot("performance-verify.svg", "Time of a verification, in digests by EVP_Digest", [
        "set style data histogram", "set style histogram clustered gap 1", "set style fill solid", "set boxwidth 0.9",
        "set logscale y", "set yrange [0.1:100]", "set key outside top center horizontal", "set xtics noenhanced",
        "$rows << EOD", *rows, "EOD",
        'plot $rows using 2:xtic(1) title "ldappw" linecolor "#1f5fa8",'
        ' "" using 3 title "OpenSSL, libxcrypt" linecolor "#e0a030"'])


def plot_threads(medians):
    names = sorted({name.partition("/")[0] for name in medians if "/threads/" in name})
    rows = []
    for number in THREADS:
        speedups = [medians["%s/threads/1" % name] / medians["%s/threads/%s" % (name, number)] for name in names]
        rows.append(" ".join([number, *("%.2f" % speedup for speedup in speedups)]))
    curves = ('$rows using 1:%d with linespoints linewidth 2 title "{%s}"' % (column, name.partition("-")[0])
              for column, name in enumerate(names, 2))
    plot("performance-threads.svg", "Throughput of verification on two cores, one thread = 1", [
        "set xlabel 'threads'", "set xtics (%s)" % ", ".join(THREADS), "set xrange [0.8:4.2]", "set yrange [0:2.4]",
        "set key outside right", "$rows << EOD", *rows, "EOD", "plot " + ", ".join(curves)])


def write(results, narrow_results, medians, repetitions):
    narrow = {(result.line["row"], result.line["peer"]): result.ratio for result in narrow_results}
    sections = itertools.groupby(results, lambda result: result.line["section"])
    tables = "\n".join("## %s\n\n%s" % (name, table(lines, narrow)) for name, lines in sections)
    (DOCS / "performance.md").write_text(TEXT.format(tables=tables, missed=missed(results), repetitions=repetitions,
                                                     machine=machine()))
    plot_verification(medians)
    plot_threads(medians)
