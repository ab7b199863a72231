// The Package Center's page: plain DOM calls over the JSON API of corv-center.
'use strict';

const state = { csrf: '', view: 'installed', details: null, tasks: new Map(), asked: new Set() };
const $ = (id) => document.getElementById(id);

function el(tag, attrs, ...children) {
  const node = document.createElement(tag);
  for (const [key, value] of Object.entries(attrs || {})) {
    if (key === 'onclick') node.addEventListener('click', value);
    else if (key === 'text') node.textContent = value;
    else node.setAttribute(key, value);
  }
  for (const child of children) node.append(child);
  return node;
}

class ApiError extends Error {
  constructor(status, body) {
    super((body && body.message) || ('HTTP ' + status));
    this.status = status;
    this.body = body;
  }
}

async function api(method, path, body) {
  const init = { method, headers: {}, credentials: 'same-origin' };
  if (method !== 'GET') init.headers['X-CSRF-Token'] = state.csrf;
  if (body instanceof FormData) init.body = body;
  else if (body !== undefined) {
    init.headers['Content-Type'] = 'application/json';
    init.body = JSON.stringify(body);
  }
  const response = await fetch(path, init);
  let data = null;
  try { data = await response.json(); } catch (e) { data = null; }
  if (response.status === 401 && path !== '/api/login') showLogin();
  if (!response.ok) throw new ApiError(response.status, data);
  return data;
}

// A result of the engine in words: its sentence, its message key, and what it names.
function resultText(result) {
  if (!result) return 'failed';
  let text = result.text || result.meaning || result.name || 'failed';
  if (result.remedy) text += ' ' + result.remedy;
  if (result.key) text += ' (' + result.key + ')';
  if (result.package && !text.includes(result.package)) text = result.package + ': ' + text;
  if (result.deppkg && !text.includes(result.deppkg)) text += '\nneeded by: ' + result.deppkg;
  if (result.services && !text.includes(result.services)) text += '\nservices: ' + result.services;
  if (result.oldver || result.curver) text += '\nversions: ' + result.oldver + ' / ' + result.curver;
  if (result.worker_msg) text += '\n' + (typeof result.worker_msg === 'string' ? result.worker_msg : JSON.stringify(result.worker_msg));
  return text;
}

function showMessage(text) {
  $('message').textContent = text;
  $('message').hidden = !text;
}

function report(error) {
  showMessage(error instanceof ApiError ? error.message : String(error));
}

function showLogin() {
  $('main-view').hidden = true;
  $('who').hidden = true;
  $('login-view').hidden = false;
}

function showMain(session) {
  state.csrf = session.csrf;
  $('user-name').textContent = session.user;
  $('who').hidden = false;
  $('login-view').hidden = true;
  $('main-view').hidden = false;
  showView('installed');
  resumeTasks();
}

function icon(url, name) {
  if (url) return el('img', { class: 'icon', src: url, alt: '' });
  return el('span', { class: 'icon', text: (name || '?').charAt(0).toUpperCase() });
}

function statusCell(row) {
  return el('td', { class: 'status status-' + row.status_word, text: row.status_word });
}

function showView(name) {
  state.view = name;
  for (const view of document.querySelectorAll('.view')) view.hidden = view.id !== 'view-' + name;
  for (const tab of document.querySelectorAll('.tab')) tab.classList.toggle('active', tab.dataset.view === name);
  const loaders = { installed: loadInstalled, store: () => loadStore(false), updates: loadUpdates };
  if (loaders[name]) loaders[name]().catch(report);
}

async function loadInstalled() {
  const rows = await api('GET', '/api/packages');
  const body = $('installed-table').tBodies[0];
  body.replaceChildren(...rows.map((row) => el('tr', { id: 'installed-' + row.package },
    el('td', {}, icon(row.icon, row.displayname)),
    el('td', {}, el('a', { href: '#', class: 'details-link', onclick: (e) => { e.preventDefault(); openDetails(row.package); } }, row.displayname)),
    el('td', { text: row.version }),
    statusCell(row),
    el('td', {}, row.startable ? controlButton(row.package, row.status === 0 ? 'stop' : 'start') : ''))));
  $('installed-empty').hidden = rows.length > 0;
}

function controlButton(name, action) {
  return el('button', { type: 'button', class: 'control-' + action, onclick: () => control(name, action) },
    action === 'stop' ? 'Stop' : 'Start');
}

async function loadStore(refresh) {
  const list = await api('GET', '/api/store' + (refresh ? '?refresh=1' : ''));
  $('store-errors').textContent = (list.errors || []).map((e) => e.source + ': ' + e.sec + '/' + e.key).join('\n');
  const body = $('store-table').tBodies[0];
  body.replaceChildren(...list.packages.map((entry) => el('tr', { id: 'store-' + entry.package },
    el('td', {}, icon(entry.thumbnail && entry.thumbnail[0], entry.dname)),
    el('td', {}, el('strong', { text: entry.dname || entry.package }), el('br'), el('small', { text: entry.desc || '' })),
    el('td', { text: entry.version }),
    el('td', { text: entry.source === 'maker' ? 'maker store' : 'feed ' + entry.source }),
    el('td', {}, entry.action === 'installed' ? el('span', { text: 'installed' })
      : el('button', { type: 'button', class: 'store-' + entry.action, onclick: () => fromStore([entry.package]) },
        entry.action === 'upgrade' ? 'Upgrade' : 'Install')))));
}

async function loadUpdates() {
  const updates = await api('GET', '/api/updates?refresh=1');
  const body = $('updates-table').tBodies[0];
  body.replaceChildren(...updates.map((entry) => el('tr', { id: 'update-' + entry.package },
    el('td', {}, el('strong', { text: entry.dname || entry.package })),
    el('td', { text: entry.installed_version + ' \u2192 ' + entry.version }),
    el('td', {}, el('button', { type: 'button', class: 'upgrade', onclick: () => fromStore([entry.package]) }, 'Upgrade')))));
  $('updates-empty').hidden = updates.length > 0;
  $('upgrade-all').disabled = updates.length === 0;
  $('upgrade-all').onclick = () => fromStore(updates.map((u) => u.package));
}

async function openDetails(name) {
  const info = await api('GET', '/api/packages/' + encodeURIComponent(name));
  state.details = info;
  showView('details');
  $('details-title').replaceChildren(icon(info.icon, info.displayname), ' ' + info.displayname + ' ' + info.version);
  $('details-description').textContent = info.description;
  const facts = [['Status', info.status_word], ['Volume', info.volume], ['Maintainer', info.maintainer]];
  if (info.adminport) facts.push(['Port', String(info.adminport)]);
  $('details-facts').replaceChildren(...facts.flatMap(([k, v]) => [el('dt', { text: k }), el('dd', { id: 'details-' + k.toLowerCase(), text: v || '' })]));
  const deps = Object.entries(info.dependencies || {});
  $('details-deps').replaceChildren(...(deps.length ? deps.map(([dep, bound]) =>
    el('li', { text: dep + (bound && typeof bound === 'object' ? ' ' + Object.entries(bound).map(([op, v]) => op + ' ' + v).join(', ') : '') }))
    : [el('li', { text: 'none' })]));
  $('details-dependents').replaceChildren(...(info.dependents.length ? info.dependents.map((d) => el('li', { text: d })) : [el('li', { text: 'none' })]));
  $('details-log').textContent = info.log || '(empty)';
  $('details-start').hidden = !info.startable || info.status === 0;
  $('details-stop').hidden = !info.startable || info.status !== 0;
}

async function control(name, action, answers) {
  showMessage('');
  try {
    const started = await api('POST', '/api/packages/' + encodeURIComponent(name) + '/' + action, { answers: answers || {} });
    track(started.task, action + ' ' + name);
  } catch (error) { report(error); }
}

function confirmUninstall() {
  const info = state.details;
  $('confirm-title').textContent = 'Uninstall ' + info.displayname + '?';
  $('confirm-text').textContent = info.dependents.length
    ? 'These installed packages depend on ' + info.package + ': ' + info.dependents.join(', ') +
      '. It cannot be uninstalled while they are installed.'
    : 'Its program files go; its settings stay.';
  $('confirm-body').replaceChildren(...wizardFields(info.uninstall_wizard || [], info.package));
  const dialog = $('confirm');
  dialog.onclose = () => {
    if (dialog.returnValue === 'ok') control(info.package, 'uninstall', collectAnswers($('confirm-body')));
  };
  dialog.returnValue = '';
  dialog.showModal();
}

async function fromStore(names) {
  showMessage('');
  try {
    const task = await api('POST', '/api/store/install', { packages: names });
    track(task.id, 'download ' + names.join(', '));
  } catch (error) { report(error); }
}

async function upload(event) {
  event.preventDefault();
  showMessage('');
  const file = $('upload-file').files[0];
  if (!file) return;
  const form = new FormData();
  form.append('file', file);
  try {
    const task = await api('POST', '/api/upload', form);
    track(task.id, 'upload ' + file.name);
  } catch (error) { report(error); }
}

// Every object with a "key" in the wizard's steps is a question, however deep.
function questionsOf(node, out) {
  if (Array.isArray(node)) node.forEach((n) => questionsOf(n, out));
  else if (node && typeof node === 'object') {
    if (typeof node.key === 'string') out.push(node);
    for (const value of Object.values(node)) if (typeof value === 'object') questionsOf(value, out);
  }
  return out;
}

function wizardFields(wizard, packageName) {
  const fields = [];
  for (const step of wizard) {
    if (step.step_title) fields.push(el('h3', { text: step.step_title }));
    for (const q of questionsOf(step.items || [], [])) {
      const checkbox = /checkbox|singleselect/.test(q.type || '');
      const input = el('input', { id: 'answer-' + q.key, 'data-key': q.key, 'data-package': packageName,
        type: checkbox ? 'checkbox' : (q.type === 'password' ? 'password' : 'text') });
      if (checkbox) input.checked = q.defaultValue === true || q.defaultValue === 'true' || q.defaultValue === 1;
      else if (q.defaultValue !== undefined) input.value = String(q.defaultValue);
      fields.push(el('label', {}, (q.desc || q.key) + ' ', input));
    }
  }
  return fields;
}

function collectAnswers(container) {
  const answers = {};
  for (const input of container.querySelectorAll('input[data-key]')) {
    answers[input.dataset.key] = input.type === 'checkbox' ? (input.checked ? 'true' : 'false') : input.value;
  }
  return answers;
}

// The questions of the files a task is about to install, and the signature verdicts.
function askWizard(task) {
  const body = $('wizard-body');
  const parts = [];
  const unsigned = [];
  for (const q of task.questions || []) {
    if (q.error) { parts.push(el('p', { class: 'error', text: resultText(q.error) })); continue; }
    parts.push(el('h3', { text: (q.upgrade ? 'Upgrade ' : 'Install ') + q.displayname + ' ' + q.version }));
    parts.push(...wizardFields(q.wizard, q.package));
    if (q.signature) unsigned.push(q.displayname + ': ' + resultText(q.signature));
  }
  $('wizard-title').textContent = 'Install ' + (task.package || (task.files || []).map((f) => f.package).join(', '));
  body.replaceChildren(...parts);
  $('wizard-signature').hidden = unsigned.length === 0;
  $('wizard-signature-text').textContent = unsigned.join('\n');
  $('wizard-accept-unsigned').checked = false;
  const dialog = $('wizard');
  dialog.onclose = async () => {
    if (dialog.returnValue !== 'ok') { cancelTask(task.id); return; }
    try {
      await api('POST', '/api/tasks/' + task.id + '/install',
        { answers: collectAnswers(body), accept_unsigned: $('wizard-accept-unsigned').checked });
      track(task.id, 'install ' + (task.package || ''));
    } catch (error) { report(error); }
  };
  dialog.returnValue = '';
  dialog.showModal();
}

async function cancelTask(id) {
  try { await api('POST', '/api/tasks/' + id + '/cancel'); } catch (error) { report(error); }
  poll(id);
}

function track(id, label) {
  if (!state.tasks.has(id)) {
    const bar = el('progress', { max: '1', value: '0' });
    const text = el('span', { class: 'task-state' });
    const cancel = el('button', { type: 'button', class: 'task-cancel', onclick: () => cancelTask(id) }, 'Cancel');
    const node = el('div', { class: 'task', id: 'task-' + id }, el('strong', { text: label }), ' ', bar, ' ', text, ' ', cancel);
    $('tasks').prepend(node);
    state.tasks.set(id, { node, bar, text, cancel });
  }
  poll(id);
}

const WORDS = { queued: 'waiting', downloading: 'downloading', ready: 'waiting for your answers',
  installing: 'installing', running: 'working', done: 'done', failed: 'failed', cancelled: 'cancelled' };

async function poll(id) {
  const view = state.tasks.get(id);
  let task;
  try { task = await api('GET', '/api/tasks/' + id); } catch (error) { report(error); return; }
  view.bar.value = task.progress || 0;
  view.text.textContent = (WORDS[task.state] || task.state) + (task.current ? ' ' + task.current : '');
  view.node.dataset.state = task.state;
  view.cancel.hidden = !['queued', 'downloading', 'ready'].includes(task.state) ||
    (task.state === 'queued' && task.action !== 'download');
  if (task.state === 'ready' && !state.asked.has(id)) {
    state.asked.add(id);
    askWizard(task);
  }
  if (['done', 'failed', 'cancelled'].includes(task.state)) {
    view.node.classList.toggle('failed', task.state === 'failed');
    if (task.state === 'failed') {
      view.text.textContent = 'failed: ' + resultText(task.result);
      showMessage(resultText(task.result));
    }
    refresh();
    return;
  }
  if (task.state !== 'ready') setTimeout(() => poll(id), 400);
}

async function resumeTasks() {
  try {
    const tasks = await api('GET', '/api/tasks');
    for (const task of tasks) {
      if (!['done', 'failed', 'cancelled', 'new'].includes(task.state)) track(task.id, (task.action || 'task') + ' ' + (task.package || ''));
    }
  } catch (error) { report(error); }
}

function refresh() {
  // A package that was just uninstalled has no details to show any more.
  if (state.view === 'details' && state.details) {
    openDetails(state.details.package).catch((error) => (error.status === 404 ? showView('installed') : report(error)));
  }
  else showView(state.view);
}

async function login(event) {
  event.preventDefault();
  $('login-error').textContent = '';
  try {
    const session = await api('POST', '/api/login', { user: $('login-user').value, password: $('login-password').value });
    $('login-password').value = '';
    showMain(session);
  } catch (error) {
    $('login-error').textContent = error instanceof ApiError ? error.message : String(error);
  }
}

document.addEventListener('DOMContentLoaded', () => {
  $('login-form').addEventListener('submit', login);
  $('logout').addEventListener('click', async () => { try { await api('POST', '/api/logout'); } finally { showLogin(); } });
  for (const tab of document.querySelectorAll('.tab')) tab.addEventListener('click', () => showView(tab.dataset.view));
  $('store-refresh').addEventListener('click', () => loadStore(true).catch(report));
  $('upload-form').addEventListener('submit', upload);
  $('details-start').addEventListener('click', () => control(state.details.package, 'start'));
  $('details-stop').addEventListener('click', () => control(state.details.package, 'stop'));
  $('details-uninstall').addEventListener('click', confirmUninstall);
  $('wizard-cancel').addEventListener('click', () => $('wizard').close());
  $('confirm-cancel').addEventListener('click', () => $('confirm').close());
  api('GET', '/api/session').then(showMain, showLogin);
});
