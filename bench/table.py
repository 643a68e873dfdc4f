"""From figures to the table that people read: Markdown, aligned, ratios beside the figures."""


def number(value):
    if value is None:
        return "-"
    if abs(value) >= 100:
        return f"{value:,.0f}"
    return f"{value:.1f}" if abs(value) >= 10 else f"{value:.2f}"


def ratio(ours, theirs):
    return f"{ours / theirs:.2f} x" if theirs else "-"


def aligned(rows):
    widths = [max(len(row[i]) for row in rows) for i in range(len(rows[0]))]
    rule = ["-" * width for width in widths]
    lines = [rows[0], rule, *rows[1:]]
    return "\n".join("| " + " | ".join(cell.ljust(width) for cell, width in zip(line, widths)) + " |"
                     for line in lines)


def crawl_tables(name, figures):
    crawl = figures["crawl"]
    ours = crawl["ours"]
    rows = [["first crawl of " + name, "MB/s", "files/s", "CPU s", "peak MB", "index MB",
             "MaruSeeker is faster by"]]
    for who, result in [("MaruSeeker", ours), *crawl["rivals"].items()]:
        rows.append([who, number(crawl["mb"] / result["seconds"]),
                     number(crawl["files"] / result["seconds"]), number(result["cpu"]),
                     number(result["peak"] or None), number(result["size"]),
                     ratio(result["seconds"], ours["seconds"]) if result is not ours else ""])
    again = crawl["again"]
    notes = (f"{crawl['files']:,} files, {number(crawl['mb'])} MB. Index against text, stored text "
             f"included: {ours['size'] / crawl['mb']:.2f}. An unchanged second crawl: "
             f"{number(crawl['files'] / again['seconds'])} files/s.")
    return aligned(rows) + "\n\n" + notes


def search_tables(name, figures):
    search = figures["search"]
    ours = search["alone"]
    rows = [["search of " + name + ", 50 hits", "p50 us", "p95 us", "p99 us", "searches/s", "hits shown",
             "p50 against MaruSeeker's"]]
    rows.append(["MaruSeeker, HTTP to HTTP", number(ours["p50"]), number(ours["p95"]),
                 number(ours["p99"]), number(ours["per_second"]), number(ours["hits"]), ""])
    loaded = search["loaded"]
    rows.append(["the same, 8 at once", number(loaded["p50"]), number(loaded["p95"]),
                 number(loaded["p99"]), number(loaded["per_second"]), "", ""])
    for who, result in search["rivals"].items():
        rows.append([who, number(result["p50"]), number(result["p95"]), number(result["p99"]),
                     number(result.get("per_second")), number(result["hits"]),
                     ratio(result["p50"], ours["p50"])])
    cpu = ", ".join(f"{who} {number(used)}" for who, used in search["cpu"].items() if used)
    return (aligned(rows) + "\n\n" + where_time_goes(search) + f"\n\nCPU per search, us: {cpu}."
            + against_engine(search))


def where_time_goes(search):
    """The median's parts: each boundary is measured, the rest is their difference."""
    front, child, daemon = (search[part]["p50"] for part in ("front", "child", "daemon"))
    engine = search["rivals"].get("bare engine", {}).get("exact", 0)
    parts = [("the front's own answer", front),
             ("host, child and plug-in that refuses at once, beyond that", child - front),
             ("the engine, bare, with exact totals", engine),
             ("the daemon beyond that: socket, rights, fields, page check", daemon - engine),
             ("the plug-in's request, reply and enrichment: the rest",
              search["alone"]["p50"] - child - daemon)]
    return aligned([["where the time of the median goes", "us"],
                    *[[what, number(time)] for what, time in parts]])


def against_engine(search):
    engine = search["rivals"].get("bare engine")
    if not engine:
        return ""
    return (f" p50 against the bare engine: {ratio(search['alone']['p50'], engine['p50'])}, with exact "
            f"totals on both sides {ratio(search['alone']['p50'], engine['exact'])}; searches/s of the "
            "whole machine against the bare engine on all cores: "
            f"{ratio(search['loaded']['per_second'], engine['per_second'])}.")


def other_rows(results):
    rows = [["figure", "value"]]
    for name, figures in results.items():
        fragments = figures.get("fragments")
        if fragments:
            rows.append([f"{name}: search with fragments of 50 hits, p50 / p95, ms",
                         f"{number(fragments['p50'] / 1e3)} / {number(fragments['p95'] / 1e3)}, the "
                         f"daemon's p50 {number(fragments['daemon'] / 1e3)}"])
        rights = figures.get("rights")
        if rights:
            for user, result in rights.items():
                rows.append([f"{name}: {user}, who may read {number(result['percent'])} % of the files, "
                             "p50 / p95, us", f"{number(result['p50'])} / {number(result['p95'])}, p95 "
                             f"{ratio(result['p95'], rights['carol']['p95'])} of carol's"])
        burst = figures.get("burst")
        if burst:
            rows.append([f"{name}: burst of 20, CPU against the last alone", number(burst["cpu"])])
            rows.append([f"{name}: burst of 20, until older work has stopped, ms",
                         number(burst["stops_ms"])])
        for method, p50 in figures.get("methods", {}).items():
            rows.append([f"{name}: {method}, p50, us", number(p50)])
        if "cold" in figures:
            for how, seconds in figures["cold"].items():
                rows.append([f"{name}: start to first answer, {how}, s", number(seconds)])
        distinct = figures.get("distinct")
        if distinct:
            rows.append([f"{name}: words asked once each, p50 / p95, us",
                         f"{number(distinct['p50'])} / {number(distinct['p95'])}"])
        clients = figures.get("clients")
        if clients:
            rows.append([f"{name}: 64 clients of three users, searches/s, p50 / p95, ms, refused",
                         f"{number(clients['per_second'])}, {number(clients['p50'] / 1e3)} / "
                         f"{number(clients['p95'] / 1e3)}, {number(clients['failed'])}"])
        changes = figures.get("changes")
        if changes:
            rows.append([f"{name}: p50 while four files a second change against quiet",
                         ratio(changes["busy"]["p50"], changes["quiet"]["p50"])])
        memory = figures.get("memory")
        if memory:
            for when, used in (("at rest", memory["rest"]), ("under load", memory["load"])):
                rows.append([f"{name}: memory {when}, MB", number(sum(used.values())) + ": " + ", ".join(
                    f"{who} {number(part)}" for who, part in used.items() if part)])
        growth = figures.get("growth")
        if growth:
            first = results.get("copies1", figures)["growth"]["search"]["p50"]
            rows.append([f"{name}: search p50 / p95, us",
                         f"{number(growth['search']['p50'])} / {number(growth['search']['p95'])}, p50 "
                         f"{ratio(growth['search']['p50'], first)} of the smallest"])
            rows.append([f"{name}: prefix of two letters, p50 / p95, ms",
                         f"{number(growth['prefix']['p50'] / 1e3)} / "
                         f"{number(growth['prefix']['p95'] / 1e3)}"])
        for who, why in figures.get("failed", {}).items():
            rows.append([f"{name}: {who} was left out", why.splitlines()[0][:60]])
    return rows


def render(results, machine):
    parts = [machine + "."]
    corpora = {name: figures for name, figures in results.items() if name != "micro"}
    for name, figures in corpora.items():
        if "crawl" in figures:
            parts.append(crawl_tables(name, figures))
        if "search" in figures:
            parts.append(search_tables(name, figures))
    rows = other_rows(corpora)
    if len(rows) > 1:
        parts.append(aligned(rows))
    if "micro" in results:
        rows = [["micro-benchmark", "ns", "MB/s"]]
        for name, row in results["micro"].items():
            speed = row.get("bytes_per_second")
            rows.append([name, number(row["cpu_time"]), number(speed / 1e6) if speed else ""])
        parts.append(aligned(rows))
    return "\n\n".join(parts) + "\n"


def check(results, where="results"):
    """Every figure must be there and above zero; an AssertionError names the first that is not."""
    if isinstance(results, dict):
        assert results or where.endswith(("failed", "rivals")), f"{where} is empty"
        assert not where.endswith("failed") or not results, f"{where}: {results}"
        for key, value in results.items():
            check(value, f"{where}.{key}")
    elif isinstance(results, (int, float)) and not isinstance(results, bool):
        # CPU is counted in hundredths of a second; older work may stop before the newest is sent.
        may_be_zero = (".cpu", "stops_ms", ".failed", "micro.")
        assert results > 0 or any(word in where for word in may_be_zero), f"{where} is {results}"
