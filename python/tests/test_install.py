# SPDX-License-Identifier: Apache-2.0
"""The package as a user gets it: installed by pip, found through the
installed package's _paths.py, or beside an installed prefix."""

import os
import shutil
import subprocess
import sys

import kvasr

PACKAGE = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))


def run_python(code, env_changes, cwd):
    env = {k: v for k, v in os.environ.items() if k not in ("KVASR_LIBRARY", "PYTHONPATH")}
    env.update(env_changes)
    return subprocess.run([sys.executable, "-c", code], capture_output=True, text=True,
                          env=env, cwd=cwd)


def test_pip_installs_a_package_that_finds_its_paths_file(tmp_path, clip):
    # Built from a copy, so that the build leaves nothing in the checkout.
    source = tmp_path / "source"
    source.mkdir()
    for name in ("pyproject.toml", "README.md"):
        shutil.copy(os.path.join(PACKAGE, name), source)
    shutil.copytree(os.path.join(PACKAGE, "kvasr"), source / "kvasr",
                    ignore=shutil.ignore_patterns("__pycache__", "_paths.py"))
    target = tmp_path / "site"
    subprocess.run([sys.executable, "-m", "pip", "install", "-q", "--no-build-isolation",
                    "--no-index", "--target", str(target), str(source)], check=True)
    library = kvasr._library.library()[1]
    models = kvasr._library.models_dir()
    (target / "kvasr" / "_paths.py").write_text(f"LIBRARY = {library!r}\nMODELS_DIR = {models!r}\n")
    done = run_python(f"import kvasr; print(kvasr.__file__); print(*kvasr.transcribe_file({clip!r}))",
                      {"PYTHONPATH": str(target)}, cwd=tmp_path)
    assert done.returncode == 0, done.stderr
    where, text = done.stdout.splitlines()
    assert where == str(target / "kvasr" / "__init__.py")
    assert "young man" in text


def test_models_are_found_beside_an_installed_prefix(tmp_path):
    prefix = tmp_path / "prefix"
    (prefix / "lib").mkdir(parents=True)
    (prefix / "share" / "kvasr").mkdir(parents=True)
    os.symlink(kvasr._library.library()[1], prefix / "lib" / "libkvasr_offline")
    os.symlink(kvasr._library.models_dir(), prefix / "share" / "kvasr" / "models")
    code = "import kvasr; print(kvasr._library.models_dir())"
    env = {"PYTHONPATH": PACKAGE, "KVASR_LIBRARY": str(prefix / "lib" / "libkvasr_offline")}
    done = run_python(code, env, cwd=tmp_path)
    assert done.returncode == 0, done.stderr
    assert done.stdout.strip() == str(prefix / "share" / "kvasr" / "models")
    os.remove(prefix / "share" / "kvasr" / "models")
    done = run_python(code, env, cwd=tmp_path)
    assert done.returncode == 1 and "no default models found" in done.stderr
    done = run_python(code, dict(env, KVASR_LIBRARY=str(tmp_path / "nowhere.so")), cwd=tmp_path)
    assert done.returncode == 1 and "libkvasr_offline not found" in done.stderr
